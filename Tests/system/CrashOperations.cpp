#include "CrashOperations.h"

#include "libkernel/archive/ArchiveStreamline.h"
#include "support/ArchiveBuilder.h"
#include "support/ArchiveFixture.h"

#include <algorithm>

namespace KernelTest {

using namespace Kernel;

std::string Describe(View const& view)
{
    std::string text = "result " + std::to_string(view.result) + " saves " + std::to_string(view.saveCount) +
                       " revisions " + std::to_string(view.revisions) + (view.scratchRevisions ? " with scratch" : "") +
                       (view.wasRecovered ? " recovered" : "");
    for (auto const& [path, bytes] : view.items) text += " " + path + "=" + bytes.substr(0, 4);
    return text;
}

View LookWith(Opener open, std::string const& path)
{
    View view;
    Counted<Archive> const archive = open(Str(path), Archive::OpenModeReadWrite, c_documentTag, view.result);
    if (!archive) return view;
    view.result = Archive::OpenOk;
    view.items = GetAll(*archive);
    view.saveCount = StateOf(*archive).saveCount;
    view.revisions = RevisionsOf(*archive).size();
    view.scratchRevisions = archive->HaveScratchRevisions();
    if (Counted<ArchiveThumbnails const> const thumbnails = archive->LoadThumbnails()) {
        for (auto const& record : thumbnails->GetRecs())
            view.thumbnail.append(static_cast<char const*>(record.data->GetData()), record.data->GetSize());
    }
    return view;
}

View Look(std::string const& path)
{
    return LookWith(Archive::Open, path);
}

View LookOrRecover(std::string const& path, Opener recover)
{
    View const view = Look(path);
    if (view.result != Archive::OpenCorrupt && view.result != Archive::OpenTruncated) return view;
    View recovered = LookWith(recover, path);
    recovered.wasRecovered = true;
    return recovered;
}

namespace {

std::string Text(int n, u64 size)
{
    std::string text(size, static_cast<char>('A' + n % 26));
    for (u64 i = 0; i < size; i += 7) text[i] = static_cast<char>('a' + (i + static_cast<u64>(n)) % 26);
    return text;
}

// A document may lie in a document; nothing of it may be taken for the outer one's.
std::string const& GetInnerDocument()
{
    static std::string const inner = [] {
        TestSupport::ArchiveBuilder builder;
        builder.AddTable({.records = {{.uid = 1, .path = "inner", .details = builder.AddBlock("inner")}}});
        return builder.Build();
    }();
    return inner;
}

Changes ChangesOf(int n)
{
    return {{"a", Text(n, 1300)},
            {"b/" + std::to_string(n), Text(n + 1, 40)},
            {"c", Text(n + 2, 30) + GetInnerDocument() + Text(n + 2, 700)}};
}

std::string DocumentPath()
{
    IDTag tag;
    return Archive::GetArchiveUID(Str(c_crashScratch), tag) == Archive::OpenOk ? c_crashScratch : c_crashMaster;
}

void SaveAs(int n, Archive::SessionType type, bool scratch)
{
    Counted<Archive> const archive = OpenDocument(DocumentPath());
    ASSERT_TRUE(archive && Save(*archive, ChangesOf(n), scratch, type, n % 2 == 1));
}

void SaveWithThumbnails(int n)
{
    Counted<Archive> const archive = OpenDocument(DocumentPath());
    ASSERT_TRUE(archive && InSession(*archive, [n](ArchiveSession& session) {
                    session.CreateFile(Str("a"), MakeCounted<BytesItem>(Text(n, 900)));
                    session.SetThumbnails(MakeThumbnails(std::string(1500, static_cast<char>('a' + n))));
                    std::string const userData = Text(n, 90);
                    ASSERT_TRUE(session.SetUserData(userData.data(), userData.size()));
                }));
}

void DeleteSome(int n)
{
    Counted<Archive> const archive = OpenDocument(DocumentPath());
    ASSERT_TRUE(archive && Save(*archive, {{"c", std::nullopt}, {"d", Text(n, 5)}}));
}

void StreamlineAs(bool overwrite)
{
    Counted<Archive> const archive = OpenDocument(DocumentPath());
    ASSERT_TRUE(archive);
    archive->SetAlwaysStreamlineOverwrite(overwrite);
    ASSERT_EQ(archive->Streamline(nullptr, nullptr, nullptr), Archive::StreamlineDone);
}

} // namespace

std::vector<CrashOperation> const& GetCrashOperations()
{
    using Kind = CrashOperation::Kind;
    auto const save = [](Archive::SessionType type, bool scratch = false) {
        return [type, scratch](int n) { SaveAs(n, type, scratch); };
    };
    static std::vector<CrashOperation> const operations = {
        {"full", Kind::Save, save(Archive::SessionTypeFull)},
        {"incremental", Kind::Save, save(Archive::SessionTypeIncremental)},
        {"rewrite", Kind::Save, save(Archive::SessionTypeRewrite)},
        {"export", Kind::Save, save(Archive::SessionTypeExport)},
        {"delete", Kind::Save, DeleteSome},
        {"thumbnails", Kind::Save, SaveWithThumbnails},
        {"streamline", Kind::Streamline, [](int) { StreamlineAs(false); }},
        {"overwrite", Kind::Overwrite, [](int) { StreamlineAs(true); }},
        {"scratch", Kind::ScratchSave, save(Archive::SessionTypeFull, true), true},
        {"roll down", Kind::Save, [](int n) { SaveAs(n + 13, Archive::SessionTypeFull, false); }, true,
         save(Archive::SessionTypeFull, true)},
    };
    return operations;
}

CrashOperation const& FindCrashOperation(std::string const& name)
{
    auto const& all = GetCrashOperations();
    return *std::find_if(all.begin(), all.end(), [&](CrashOperation const& one) { return one.name == name; });
}

TestSupport::MemoryDisk::Image MakeCrashDocument(TestSupport::MemoryDisk& disk, bool withScratch)
{
    disk.Load({});
    {
        Counted<Archive> const archive = CreateDocument(c_crashMaster);
        Archive::CreateResult result;
        EXPECT_TRUE(SaveStep(*archive, 24) && SaveStep(*archive, 0)); // So that streamlining has something to drop.
        if (withScratch) {
            EXPECT_TRUE(archive->AddScratchFile(Str(c_crashScratch), result));
        }
    }
    return disk.GetImage();
}

std::vector<CrashReplacement> const& GetCrashReplacements()
{
    using Result = Archive::CreateResult;
    auto const inFolder = [](Result& result) {
        return Archive::CreateWithTemporary(Str(c_crashMaster), c_documentTag, result);
    };
    auto const adjacent = [](Result& result) {
        return Archive::CreateWithAdjacentTemporary(Str(c_crashMaster), c_documentTag, result, {});
    };
    auto const ofOpen = [](Result& result) {
        return OpenDocument(c_crashMaster)->CreateReplacementWithTemporary(result, {});
    };
    static std::vector<CrashReplacement> const replacements = {
        {"a temporary in its folder", true, inFolder},
        {"a temporary in its folder, for a new document", false, inFolder},
        {"a temporary beside the target", true, adjacent},
        {"a temporary beside the target, for a new document", false, adjacent},
        {"a replacement of an open document", true, ofOpen},
    };
    return replacements;
}

bool SaveStep(Archive& archive, int n)
{
    return Save(archive, ChangesOf(n));
}

} // namespace KernelTest
