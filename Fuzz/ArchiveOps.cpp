#include "ArchiveChecks.h"
#include "support/CrashImages.h"

namespace {

using namespace Kernel;
using namespace Kernel::Fuzz;

// A document that bytes drive, beside a plain model of what it holds.
class Document
{
public:
    explicit Document(Input& input) : m_input(input)
    {
        Archive::CreateResult created;
        m_archive = Archive::Create(Str(c_masterPath), IDTag("Fuzz"), created);
        Require(static_cast<bool>(m_archive), "a document can be made");
    }

    void Run()
    {
        for (int steps = 0; steps < 40 && m_input.GetLeft() != 0; ++steps) {
            u32 const operation = m_input.TakeBelow(10);
            u32 const cut = m_input.TakeBelow(4) == 0 ? 1 + m_input.Take() : 0;
            if (cut) m_disk->StartRecording();
            State const before = m_state;
            Step(operation);
            if (cut) Cut(before, cut);
            Compare();
        }
        Reopen();
        Compare();
        m_archive = nullptr;
        Require(m_disk->GetOpenHandles() == 0, "no handle is left");
    }

private:
    struct State
    {
        Items master; // What the master alone holds.
        Items head;   // What the pair holds.
        bool hasScratch = false;
    };

    Changes TakeChanges()
    {
        Changes changes;
        for (u32 n = m_input.TakeBelow(4); n != 0; --n) {
            std::string const path = "item" + std::to_string(m_input.TakeBelow(6));
            u8 const what = m_input.Take();
            if (what % 4 == 0)
                changes[path] = std::nullopt;
            else
                changes[path] =
                    std::string(what % 4 == 1 ? u64{what} * 40 : what / 16, static_cast<char>('a' + what % 26));
        }
        return changes;
    }

    void SaveInto(bool scratch)
    {
        // Items that are new each time are dirty, so each type of session writes them.
        auto const type = static_cast<Archive::SessionType>(m_input.TakeBelow(4));
        bool const compress = m_input.TakeBool();
        Changes const changes = TakeChanges();
        Require(Save(*m_archive, changes, scratch, type, compress) == SaveOutcome::Saved, "a sound document saves");
        m_state.head = Applied(m_state.head, changes);
        if (!scratch) m_state.master = m_state.head;
    }

    void Step(u32 operation)
    {
        switch (operation) {
        case 0:
        case 1: return SaveInto(false);
        case 2:
        case 3: return SaveInto(m_state.hasScratch);
        case 4: {
            if (m_state.hasScratch) return;
            Archive::CreateResult result;
            m_state.hasScratch = m_archive->AddScratchFile(Str(c_scratchPath), result);
            Require(m_state.hasScratch, "a scratch file can be added");
            return;
        }
        case 5: {
            // A rewrite is of the state that both files have together.
            if (m_archive->RequiresStreamlining()) m_state.master = m_state.head;
            Require(m_archive->Streamline(nullptr, nullptr, nullptr) == Archive::StreamlineDone,
                    "a sound document can be streamlined");
            return;
        }
        case 6: {
            LookAround(*m_archive);
            return;
        }
        case 7: return Reopen();
        case 8: {
            // A session that is let go of leaves nothing.
            ArchiveSessionHandle handle;
            Require(m_archive->CreateSession(handle, Archive::SessionTypeFull, nullptr), "a session can be had");
            handle->CreateFile(Str("dropped"), MakeCounted<KernelTest::BytesItem>("dropped"));
            handle->DeleteFile(Str("item1"));
            return;
        }
        default: {
            auto const copy = MakeCounted<FragmentedRawData>(4096);
            Require(m_archive->StreamlineToFragmentedRawData(*copy) == Archive::StreamlineDone, "a copy can be made");
            std::string bytes(copy->GetSize(), 0);
            copy->GetData(0, bytes.data(), bytes.size());
            Require(TestBytes(bytes) == Archive::OpenOk, "a compact copy is sound");
            return;
        }
        }
    }

    // Path to open, and whether recovery may be needed there.
    static Counted<Archive> OpenOrRecover(std::string const& path, Open& result)
    {
        Counted<Archive> archive = OpenBy(Archive::Open, path, result);
        if (result == Archive::OpenCorrupt || result == Archive::OpenTruncated)
            archive = OpenBy(Archive::RecoverArchive, path, result);
        return archive;
    }

    void Reopen()
    {
        m_archive = nullptr;
        Open result{};
        m_archive = OpenBy(Archive::Open, m_state.hasScratch ? c_scratchPath : c_masterPath, result);
        Require(static_cast<bool>(m_archive), "a sound document opens");
    }

    // The power goes at some moment of the step just done.
    void Cut(State const& before, u32 cut)
    {
        m_archive = nullptr;
        MemoryDisk::Recording const recording = m_disk->StopRecording();
        u64 const steps = recording.steps.empty() ? 0 : cut % (recording.steps.size() + 1);
        MemoryDisk::Image image = TestSupport::MakeCrashImage(recording, steps, m_input.Take());
        // Between the two renames of a streamline the master has another name for a moment. A backup that was there
        // before is one that an earlier cut has left.
        if (!image.count(c_masterPath)) {
            for (auto const& [path, content] : image) {
                if (path == c_scratchPath || recording.names.count(path)) continue;
                if (TestBytes(*content) != Archive::OpenOk) continue;
                auto const moved = content;
                image.erase(path);
                image[c_masterPath] = moved;
                break;
            }
        }
        m_disk->Load(image);
        Require(image.count(c_masterPath), "a crash takes no document");
        Open result{};
        State const after = m_state;
        m_state.hasScratch = false;
        if (image.count(c_scratchPath)) {
            if (Counted<Archive> const pair = OpenOrRecover(c_scratchPath, result)) {
                m_state.hasScratch = true;
                m_state.head = ReadAll(*pair);
                Require(m_state.head == before.head || m_state.head == after.head,
                        "a crash leaves the pair old or new");
                // The next save makes lasting what recovery found.
                Changes const changes = {{"item0", "cut"}};
                Require(Save(*pair, changes, true) == SaveOutcome::Saved, "a pair saves after a crash");
                m_state.head = Applied(m_state.head, changes);
            } else {
                image.erase(c_scratchPath);
                m_disk->Load(image);
            }
        }
        m_archive = OpenOrRecover(c_masterPath, result);
        Require(static_cast<bool>(m_archive), "a crash leaves a master that opens");
        Items const master = ReadAll(*m_archive);
        Require(master == before.master || master == after.master, "a crash leaves the master old or new");
        m_state.master = master;
        if (!m_state.hasScratch) {
            m_state.head = master;
            Require(Save(*m_archive, {{"item0", "cut"}}) == SaveOutcome::Saved, "a document saves after a crash");
            m_state.head["item0"] = "cut";
            m_state.master = m_state.head;
        }
        Reopen();
    }

    void Compare() { Require(ReadAll(*m_archive) == m_state.head, "the archive holds what the model holds"); }

    Input& m_input;
    LonelyDisk m_disk;
    State m_state;
    Counted<Archive> m_archive;
};

} // namespace

// A run takes and gives back megabytes, many times over. Of what is given back the sanitizer keeps a part, to see later
// uses of it; by its own choice that would come near the limit of memory that a target has.
extern "C" char const* __asan_default_options();
extern "C" char const* __asan_default_options()
{
    return "quarantine_size_mb=64";
}

// Each step: the operation, whether the power is cut in it, and what the operation takes.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    Input input(data, size);
    Document(input).Run();
    return 0;
}
