#include "support/ArchiveOperations.h"

#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/filestore/BackstoreException.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filestore/FileStoreBackData.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/SerialiseFrom.h"
#include "libkernel/serialisation/SerialiseTo.h"
#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/streams/OutStream.h"

#include <chrono>
#include <future>
#include <new>
#include <sstream>
#include <thread>

namespace KernelTest {

using namespace Kernel;
using TestSupport::MemoryDisk;

using Start = StartState;

namespace {

char const* const c_doc = "/ram/doc";
char const* const c_scratch = "/ram/scratch";
char const* const c_new = "/ram/new";
char const* const c_moved = "/ram/moved";
char const* const c_settings = "/ram/settings";

std::string Numbered(char const* what, int n)
{
    return n == 0 ? "ok" : std::string(what) + " " + std::to_string(n);
}

std::string Kept(Counted<Archive>& place, Counted<Archive> const& archive, Archive::OpenResult result)
{
    place = archive;
    if (!archive == (result == Archive::OpenOk)) return "result and archive disagree";
    return Numbered("open", result);
}

std::string Kept(Counted<Archive>& place, Counted<Archive> const& archive, Archive::CreateResult const& result)
{
    place = archive;
    if (!archive == (result.GetCode() == Archive::CreateResult::Code::Ok)) return "result and archive disagree";
    return Numbered("create", static_cast<int>(result.GetCode()));
}

std::function<void(World&)> Opened(char const* path, size_t itemSize = 1500, bool overwrites = false)
{
    return [=](World& world) {
        world.archive = OpenDocument(path);
        world.archive->SetAlwaysStreamlineOverwrite(overwrites);
        world.item = MakeCounted<BytesItem>(std::string(itemSize, 'n'));
    };
}

enum class How
{
    Plain,
    Verified,
    Thumbnails
};

// One save of the world's item, beside a packed one, a deletion and user data.
std::string SaveInto(World& world, Archive::SessionType type, bool scratch, How how = How::Plain)
{
    ArchiveSessionHandle handle;
    Archive& archive = *world.archive;
    if (scratch) {
        if (!archive.CreateScratchSession(handle, type, &world.abort)) return "no session";
    } else if (int const result = archive.CreateSessionAdv(handle, type, &world.abort, false)) {
        return Numbered("session", result);
    }
    handle->CreateFile(Str("a"), world.item);
    handle->CreateFile(Str("packed"), MakeCounted<BytesItem>(std::string(700, 'p')), Compressed());
    handle->DeleteFile(Str("b"));
    if (!handle->SetUserData("user", 4)) return "no memory";
    if (how == How::Thumbnails) handle->SetThumbnails(MakeThumbnails(std::string(200, 'n')));
    if (how == How::Verified) {
        String8 report;
        return Numbered("verify", archive.CloseSessionAndVerifyFileState(handle, report, false));
    }
    archive.CloseSession(handle, true);
    return "ok";
}

// An archive that @p make gives, with its result, for the world to keep; and a first save into it if @p saves.
template <class Result, class Make>
std::function<std::string(World&)> Making(Make make, bool saves)
{
    return [=](World& world) {
        Result result{};
        Counted<Archive> const archive = make(world, result);
        std::string const kept = Kept(world.archive, archive, result);
        if (kept != "ok" || !saves) return kept;
        world.item = MakeCounted<BytesItem>(std::string(900, 'f'));
        return SaveInto(world, Archive::SessionTypeFull, false);
    };
}

template <class Make>
std::function<std::string(World&)> Creating(Make make, bool saves = true)
{
    return Making<Archive::CreateResult>(make, saves);
}

std::function<std::string(World&)> Saving(Archive::SessionType type, bool scratch, How how = How::Plain)
{
    return [=](World& world) { return SaveInto(world, type, scratch, how); };
}

template <class Make>
std::function<std::string(World&)> OpeningBy(Make make)
{
    return Making<Archive::OpenResult>(make, false);
}

std::function<std::string(World&)> Opening(Archive::OpenMode mode, char const* path)
{
    return OpeningBy([=](World&, auto& result) { return Archive::Open(Str(path), mode, c_documentTag, result); });
}

template <class Work>
std::function<std::string(World&)> Streamlining(Work work)
{
    return [=](World& world) { return Numbered("streamline", work(world)); };
}

class Waiter : public Archive::OffliningUpdater
{
public:
    void Progress(u64, u64) override {}
    void Complete() override { m_result.set_value("ok"); }
    void Aborted() override { m_result.set_value("offlining aborted"); }
    void Failed(int reason) override { m_result.set_value(reason == 1 ? "offlining 1" : "offlining 2"); }
    std::string Wait() { return m_result.get_future().get(); }

private:
    std::promise<char const*> m_result;
};

/// The job holds the archive and its files for a moment longer than it takes to tell its end.
struct JobIsOver
{
    explicit JobIsOver(Archive const& archive) : m_archive(archive) {}
    ~JobIsOver()
    {
        auto const end = std::chrono::steady_clock::now() + std::chrono::seconds(5);
        while (m_archive.GetReferenceCount() > 1 && std::chrono::steady_clock::now() < end) std::this_thread::yield();
    }
    Archive const& m_archive;
};

std::string Offlined(World& world)
{
    JobIsOver const over(*world.archive);
    // One that has failed is over, and one that finds no file does not begin: neither calls anybody.
    if (world.archive->GetOffliningState() != Archive::OffliningNotStarted) return "offlining 1";
    auto const waiter = MakeCounted<Waiter>();
    world.archive->StartOffline(waiter);
    if (world.archive->GetOffliningState() == Archive::OffliningNotStarted) return "offlining 2";
    std::string const result = waiter->Wait();
    world.archive->AbortOfflining();
    return result;
}

std::string BackData(World& world)
{
    for (char const* path : {"a", "packed"}) {
        Counted<Archive::Revision const> const revision = world.archive->GetHeadRevisionForFile(Str(path));
        Counted<FileStoreBackData const> const data = world.archive->CreateBackData(revision, Str(path));
        if (!data) return "no back data";
        if (!data->LoadItem(*MakeCounted<BytesItem>())) return "not loaded";
    }
    return "ok";
}

std::string Migrated(World& world)
{
    if (int const result = world.archive->MigratePrepare(Str(c_moved))) return Numbered("migrate", result);
    return Numbered("open", world.archive->MigrateRestore(Str(c_moved)));
}

std::string ReadAll(World& world)
{
    for (auto const& [path, bytes] : GetAll(*world.archive))
        if (bytes == "(unreadable)") return "unreadable";
    return world.archive->LoadThumbnails() ? "ok" : "no thumbnails";
}

std::string CheckAll(World& world)
{
    std::vector<Counted<Archive::Revision const>> revisions;
    world.archive->GetRevisions(revisions);
    for (auto const& revision : revisions)
        for (Archive::FileRevision const& entry : revision->GetEntries())
            if (auto const check = world.archive->CheckStoredBlock(*revision, entry);
                !entry.IsDeletion() && check != Archive::BlockCheck::Ok)
                return Numbered("check", static_cast<int>(check));
    return "ok";
}

std::string ReadStream(World& world)
{
    char bytes[700];
    Counted<InStream> const stream = world.archive->OpenFileInStream(Str("packed"));
    return !stream ? "no stream" : stream->ReadBlock(bytes, sizeof(bytes)) == sizeof(bytes) ? "ok" : "short";
}

bool SaveSettings(int value)
{
    auto const save = [value](OutSerialiser& out, IDTag tag) { out.SaveType(tag, value); };
    return SerialiseToFile(c_settings, "Sett", 1, save, 6);
}

std::string SettingsBack(World&)
{
    auto const load = [](InSerialiser& in, IDTag tag) {
        int value = 0;
        return in.LoadType(tag, value) && value == 1;
    };
    return SerialiseFromFile(c_settings, "Sett", 1, load, true) ? "ok" : "false";
}

auto const nothing = [](World&) {};
auto const openedOther = [](World& world) { world.other = OpenDocument(c_doc); };

std::vector<ArchiveOperation> MakeOperations()
{
    using Type = Archive::SessionType;
    // What any file of a save may fail with, by name: no session for want of a file, or the session's own exceptions.
    std::string const save = "session 9,no session,file 0 1 2 3 4 5 7 8,write";
    return {
        {"create", Start::Nothing, nothing,
         Creating([](World&, auto& result) { return Archive::Create(Str(c_new), c_documentTag, result); }, false),
         "create *"},
        {"create as scratch", Start::Nothing, nothing,
         Creating(
             [](World&, auto& result) { return Archive::CreateAsScratch(Str(c_new), c_documentTag, nullptr, result); },
             false),
         "create *"},
        {"create throw-away and save", Start::Nothing, nothing,
         Creating([](World&, auto& result) { return Archive::CreateAsThrowAway(c_documentTag, result); }),
         "create *," + save},
        {"create with temporary and save", Start::Document, nothing,
         Creating([](World&, auto& result) { return Archive::CreateWithTemporary(Str(c_doc), c_documentTag, result); }),
         "create *," + save},
        {"create new with temporary and save", Start::Nothing, nothing,
         Creating([](World&, auto& result) { return Archive::CreateWithTemporary(Str(c_new), c_documentTag, result); }),
         "create *," + save},
        {"create with adjacent temporary and save", Start::Document, nothing, Creating([](World&, auto& result) {
             return Archive::CreateWithAdjacentTemporary(Str(c_doc), c_documentTag, result, {});
         }),
         "create *," + save},
        {"replace and save", Start::Document, openedOther,
         Creating([](World& w, auto& result) { return w.other->CreateReplacementWithTemporary(result, {}); }),
         "create *," + save},
        {"add scratch file", Start::Document, Opened(c_doc),
         Creating([](World& w, auto& r) { return w.archive->AddScratchFile(Str(c_scratch), r) ? w.archive : nullptr; },
                  false),
         "create 2 6"},
        {"open", Start::Pair, nothing, Opening(Archive::OpenModeReadWrite, c_scratch), "open *"},
        {"open read-only", Start::Pair, nothing, Opening(Archive::OpenModeReadOnly, c_scratch), "open *"},
        {"open either way", Start::Document, nothing, Opening(Archive::OpenModeReadWriteOrReadOnly, c_doc), "open *"},
        {"open coordinated", Start::Document, nothing, Opening(Archive::OpenModeCoordinated, c_doc), "open *"},
        {"open as scratch", Start::Alone, nothing,
         OpeningBy([](World&, auto& r) { return Archive::OpenAsScratch(Str(c_scratch), c_documentTag, r); }), "open *"},
        {"open throw-away", Start::Document, openedOther,
         [](World& w) {
             auto const data = MakeCounted<FragmentedRawData>(4096);
             if (int const result = w.other->StreamlineToFragmentedRawData(*data))
                 return Numbered("streamline", result);
             return OpeningBy([&](World&, auto& r) { return Archive::OpenAsThrowaway(*data, c_documentTag, r); })(w);
         },
         "open *,streamline 2 4"},
        {"open migrate", Start::Document, nothing,
         OpeningBy([](World&, auto& r) { return Archive::OpenMigrate(Str(c_doc), Str(c_moved), c_documentTag, r); }),
         "open *"},
        {"recover", Start::Damaged, nothing, OpeningBy([](World&, auto& r) {
             return Archive::RecoverArchive(Str(c_doc), Archive::OpenModeReadWrite, c_documentTag, r);
         }),
         "open *"},
        {"look at links", Start::Pair, nothing,
         [](World&) {
             IDTag tag;
             Archive::LinkInfo info;
             if (int const result = Archive::GetArchiveUID(Str(c_doc), tag)) return Numbered("open", result);
             if (int const result = Archive::TestForScratchLinkAndReferenceInfo(Str(c_scratch), false, info))
                 return Numbered("open", result);
             if (Archive::IsMidStreamlineFile(Str(c_doc))) return std::string("mid-streamline");
             return std::string(Archive::VerifyLinks(Str(c_scratch)) ? "ok" : "links differ");
         },
         "open *,links differ"},
        {"full save", Start::Document, Opened(c_doc), Saving(Type::SessionTypeFull, false), save},
        {"save of several buffers", Start::Document, Opened(c_doc, 2'000'000), Saving(Type::SessionTypeFull, false),
         save},
        {"incremental save", Start::Document, Opened(c_doc), Saving(Type::SessionTypeIncremental, false), save},
        {"rewrite save", Start::Document, Opened(c_doc), Saving(Type::SessionTypeRewrite, false), save},
        {"export save", Start::Document, Opened(c_doc), Saving(Type::SessionTypeExport, false), save},
        {"full scratch save", Start::Pair, Opened(c_scratch), Saving(Type::SessionTypeFull, true), save},
        {"incremental scratch save", Start::Pair, Opened(c_scratch), Saving(Type::SessionTypeIncremental, true), save},
        {"rewrite scratch save", Start::Pair, Opened(c_scratch), Saving(Type::SessionTypeRewrite, true), save},
        {"export scratch save", Start::Pair, Opened(c_scratch), Saving(Type::SessionTypeExport, true), save},
        {"roll down", Start::Pair, Opened(c_scratch), Saving(Type::SessionTypeFull, false), save},
        {"close and verify", Start::Pair, Opened(c_scratch), Saving(Type::SessionTypeFull, false, How::Verified),
         save + ",verify 1 2"},
        {"thumbnails", Start::Document, Opened(c_doc), Saving(Type::SessionTypeFull, false, How::Thumbnails), save},
        {"streamline", Start::Pair, Opened(c_scratch),
         Streamlining([](World& w) { return w.archive->Streamline(&w.abort, nullptr, nullptr); }),
         "streamline 2 3 4 7 8"},
        {"streamline and verify", Start::Document, Opened(c_doc), Streamlining([](World& w) {
             String8 report;
             return w.archive->StreamlineAndVerifyFileState(report, &w.abort, nullptr, nullptr);
         }),
         "streamline 2 3 4 6 7 8"},
        {"streamline by overwriting", Start::Pair, Opened(c_scratch, 1500, true),
         Streamlining([](World& w) { return w.archive->Streamline(&w.abort, nullptr, nullptr); }),
         "streamline 2 3 4 7 8"},
        {"streamline to new", Start::Document, Opened(c_doc),
         Streamlining([](World& w) { return w.archive->StreamlineToNew(Str(c_new)); }), "streamline 2 3 4 8"},
        {"streamline to stream", Start::Pair, Opened(c_scratch),
         Streamlining([](World& w) { return w.archive->StreamlineToOutStream(*MakeCounted<MemoryInOutStream>()); }),
         "streamline 2 4"},
        {"streamline and switch", Start::Document, Opened(c_doc),
         Streamlining([](World& w) { return w.archive->StreamlineAndSwitch(Str(c_new)); }), "streamline 2 3 4 8"},
        {"streamline and switch as scratch", Start::Document, Opened(c_doc),
         Streamlining([](World& w) { return w.archive->StreamlineAndSwitchAsScratch(Str(c_new)); }),
         "streamline 2 3 4 8"},
        {"capture to throw-away", Start::Document, Opened(c_doc),
         [](World& w) { return Numbered("capture", w.archive->CaptureToThrowaway()); }, "capture 1 2"},
        {"convert to throw-away", Start::Document, Opened(c_doc),
         [](World& w) { return Numbered("convert", w.archive->ConvertToThrowAway()); }, "convert 1 2 3"},
        {"extract", Start::Document, Opened(c_doc),
         [](World& w) { return std::string(w.archive->ExtractToRawData() ? "ok" : "null"); }, "null"},
        {"back data", Start::Document, Opened(c_doc), BackData, "no back data,not loaded,backstore,file 0 8,corrupt"},
        {"offlining", Start::Document, Opened(c_doc), Offlined, "offlining 1 2"},
        {"migrate", Start::Pair, Opened(c_scratch), Migrated, "migrate 4 6,open *"},
        {"external update", Start::Document, Opened(c_doc),
         [](World& w) {
             if (int const result = w.archive->ExternalUpdatePrepare()) return Numbered("prepare", result);
             return std::string(w.archive->ExternalUpdateRestore() ? "ok" : "not restored");
         },
         "not restored"},
        {"read all", Start::Pair, Opened(c_scratch), ReadAll, "unreadable,no thumbnails"},
        {"check all", Start::Pair, Opened(c_scratch), CheckAll, "check 1"},
        {"read a stream", Start::Document, Opened(c_doc), ReadStream, "no stream,short,corrupt,file 8"},
        {"save settings", Start::Settings, nothing, [](World&) { return SaveSettings(2) ? "ok" : "false"; }, "false"},
        {"load settings", Start::Settings, nothing, SettingsBack, "false"},
    };
}

} // namespace

std::vector<ArchiveOperation> const& GetArchiveOperations()
{
    static auto const list = MakeOperations();
    return list;
}

std::string RunOperation(ArchiveOperation const& operation, World& world)
{
    try {
        return operation.run(world);
    } catch (ArchiveFileException const& e) {
        return "file " + std::to_string(static_cast<int>(e.GetReason()));
    } catch (OutStream::WriteException const&) {
        return "write";
    } catch (AbortException const&) {
        return "abort";
    } catch (ArchiveCorruptionException const&) {
        return "corrupt";
    } catch (BackstoreException const&) {
        return "backstore";
    } catch (MemoryException const&) {
        return "memory";
    } catch (std::bad_alloc const&) {
        return "memory";
    } catch (...) {
        return "stray exception";
    }
}

bool IsNamed(ArchiveOperation const& operation, std::string const& result)
{
    std::istringstream failures("ok," + operation.failures);
    for (std::string one; std::getline(failures, one, ',');) {
        if (one == result) return true;
        std::istringstream words(one);
        std::string name;
        words >> name;
        for (std::string number; words >> number;)
            if (result == name + " " + number || (number == "*" && result.starts_with(name + " "))) return true;
    }
    return false;
}

OperationDisk::OperationDisk()
{
    auto const& calls = Platform::GetFileCalls();
    for (char const* folder : {"/ram/temp", "/ram/second"}) calls.makeFolder(folder);
    std::vector<String8> rescued;
    TempFile::SetTempPath(Str("/ram/temp"), Str("/ram/second"), rescued);
    m_starts[Start::Nothing] = {};
    {
        Counted<Archive> const archive = CreateDocument(c_doc);
        Save(*archive, {{"a", std::string(1300, 'a')}, {"b", "short"}, {"gone", "x"}});
        Save(*archive, {{"gone", std::nullopt}, {"b", std::string(300, 'b')}});
        Save(*archive, {{"packed", std::string(700, 'o')}}, false, Archive::SessionTypeFull, true);
        InSession(*archive, [](ArchiveSession& session) {
            session.CreateFile(Str("d"), MakeCounted<BytesItem>("d"));
            session.SetThumbnails(MakeThumbnails(std::string(200, 'o')));
        });
        m_starts[Start::Document] = m_disk.GetImage();
        AddScratchFile(*archive, c_scratch);
        Save(*archive, {{"a", std::string(1200, 's')}, {"e", "scratch"}}, true);
    }
    m_starts[Start::Pair] = m_disk.GetImage();
    m_starts[Start::Damaged] = m_starts[Start::Document];
    std::string damaged = *m_starts[Start::Document].at(c_doc);
    damaged.replace(12, 40, 40, '\xff');
    m_starts[Start::Damaged][c_doc] = std::make_shared<std::string const>(damaged);
    m_disk.Load({});
    {
        Archive::CreateResult result;
        Counted<Archive> const archive = Archive::CreateAsScratch(Str(c_scratch), c_documentTag, nullptr, result);
        Save(*archive, {{"a", "alone"}}, true);
    }
    m_starts[Start::Alone] = m_disk.GetImage();
    m_disk.Load({});
    SaveSettings(1);
    m_starts[Start::Settings] = m_disk.GetImage();
}

OperationDisk::~OperationDisk()
{
    TempFile::SetTempPath(String8());
}

DiskView LookAtDisk(MemoryDisk& disk)
{
    DiskView view;
    for (char const* path : {c_doc, c_scratch, c_new, c_moved}) {
        PathView& one = view[path];
        Archive::OpenResult result{};
        Counted<Archive> archive = Archive::Open(Str(path), Archive::OpenModeReadOnly, c_documentTag, result);
        one.recovered =
            result == Archive::OpenCorrupt || result == Archive::OpenTruncated || result == Archive::OpenBadInfo;
        if (one.recovered)
            archive = Archive::RecoverArchive(Str(path), Archive::OpenModeReadOnly, c_documentTag, result);
        one.result = result;
        if (archive) one.items = GetAll(*archive);
    }
    for (auto const& [path, bytes] : disk.GetImage())
        if (path == c_settings) view[path].bytes = *bytes;
    return view;
}

// A whole copy under a name that is made up on the way.
bool HasCopy(MemoryDisk& disk, PathView const& of)
{
    for (auto const& [path, bytes] : disk.GetImage()) {
        if (path.find("/doc") == path.npos && path.find("/second/") == path.npos) continue;
        Archive::OpenResult result{};
        Counted<Archive> const archive = Archive::Open(Str(path), Archive::OpenModeReadOnly, c_documentTag, result);
        if (archive && GetAll(*archive) == of.items) return true;
    }
    return false;
}

std::string CompareViews(DiskView const& found, DiskView const& before, DiskView const& after, bool succeeded)
{
    bool const masterMoved = !(found.at(c_doc) == before.at(c_doc)) || !(before.at(c_doc) == after.at(c_doc));
    for (auto const& [path, one] : found) {
        PathView const& old = before.at(path);
        if (one == after.at(path) || (!succeeded && one == old)) continue;
        bool const useless = one.result == Archive::OpenNotArchive || one.result == Archive::OpenCorrupt ||
                             one.result == Archive::OpenBadInfo || one.result == Archive::OpenTruncated;
        bool const isEmpty = one.result == Archive::OpenOk && one.items.empty();
        if (!succeeded && old.result == Archive::OpenNotFound && (useless || isEmpty)) continue;
        bool const isUnlinked =
            one.result == Archive::OpenLinkMismatch || one.result == Archive::OpenLinkedNotFound || useless;
        if (path == c_scratch && masterMoved && isUnlinked) continue;
        std::ostringstream text;
        text << path << " is neither old nor new: result " << one.result << ", " << one.bytes.size() << " bytes";
        for (auto const& [name, bytes] : one.items) text << " " << name << "=" << bytes.substr(0, 3) << bytes.size();
        return text.str();
    }
    return {};
}

} // namespace KernelTest
