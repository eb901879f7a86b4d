#include "Diagnostics.h"
#include "Interrupt.h"
#include "OpenedArchive.h"
#include "ProgressBar.h"
#include "Reservation.h"
#include "Verbs.h"
#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/platform/PlatformFile.h"

// The verb that compacts a document.

namespace KernelTool {

using namespace Kernel;

namespace {

/// Shows how far the writing is. Ctrl-C reaches the library by the abort flag.
class ToolProgress : public ArchiveStreamlineProgress
{
public:
    explicit ToolProgress(Arguments const& arguments) : m_arguments(arguments) {}
    void OnProgress(u64 done, u64 total) override
    {
        // The files first; then, if the document is overwritten, its bytes.
        if (!m_work || total != m_total) {
            m_work = std::make_unique<LongWork>(m_work ? "Overwriting" : "Streamlining", total, m_arguments);
            m_total = total;
            m_done = 0;
        }
        u64 const step = done - m_done;
        m_done = done;
        try {
            m_work->Advance(step);
        } catch (AbortException const&) {
        }
    }
    void End() { m_work = nullptr; }

private:
    Arguments const& m_arguments;
    std::unique_ptr<LongWork> m_work;
    u64 m_done = 0;
    u64 m_total = 0;
};

/// A folder beside the document for the temporary that an overwriting starts from. It goes when it is empty: after a
/// failure in the middle it has the only whole copy.
class TemporaryFolder
{
public:
    explicit TemporaryFolder(String8 const& document) : m_path(document + "~streamline"), m_second(m_path + "/whole")
    {
        if (!FileSystem::CreateDirectoryRecursive(m_second + "/")) return;
        std::vector<String8> rescued;
        TempFile::SetTempPath(m_path, m_second, rescued);
        m_set = true;
    }
    TemporaryFolder(TemporaryFolder const&) = delete;
    TemporaryFolder& operator=(TemporaryFolder const&) = delete;
    ~TemporaryFolder()
    {
        if (m_set) TempFile::SetTempPath(String8());
        Platform::GetFileCalls().removeFolder(m_second.GetData());
        Platform::GetFileCalls().removeFolder(m_path.GetData());
    }
    String8 const& GetPath() const { return m_second; }

private:
    String8 const m_path;
    String8 const m_second;
    bool m_set = false;
};

u64 SizeOf(String8 const& path)
{
    i64 const size = FileSystem::GetFileSize(path);
    return size < 0 ? 0 : static_cast<u64>(size);
}

void ThrowIfFailed(Archive::StreamlineResult result, std::string const& what, String8 const& document,
                   String8 const& temporaries)
{
    if (result == Archive::StreamlineDone) return;
    if (result == Archive::StreamlineAborted) throw AbortException();
    Failure failure = MakeFailure(what, result);
    if (result == Archive::StreamlineNotVerified) failure.status = ExitDamaged;
    if (!FileSystem::Exists(document))
        failure.advice = "The document lies beside its name, with '~backup' behind it: rename it back.";
    else if (result == Archive::StreamlineOverwriteFailed || result == Archive::StreamlineNoSpace)
        failure.advice = "The only whole copy of the document may be the file in '" + ToStd(temporaries) + "', or '" +
                         ToStd(document) + "~tmp'.";
    throw failure;
}

int Report(Arguments const& arguments, Json report, std::string const& text)
{
    if (arguments.Has(Option::Json))
        PrintJson(report);
    else
        Print(text);
    return ExitDone;
}

std::string Sizes(u64 before, u64 after)
{
    return FormatSize(before) + " before, " + FormatSize(after) + " after";
}

int StreamlineTo(Arguments const& arguments, bool verify)
{
    String8 const from = arguments.At(0);
    String8 const to = arguments.GetString(Option::To);
    if (to.IsEmpty()) throw UsageProblem{"--to takes the path of a new file"};
    Counted<Archive> const archive = OpenForReading(arguments);
    Reservation reservation(to);
    std::string const what = "writing '" + ToStd(to) + "'";
    ThrowIfFailed(archive->StreamlineToNew(to), what, from, String8());
    reservation.Use();
    Json damaged = Json::array();
    u64 checked = 0;
    if (verify) {
        Archive::OpenResult result{};
        Counted<Archive> const copy = Archive::Open(to, Archive::OpenModeReadOnly, archive->GetArchiveIDTag(), result);
        if (!copy) throw MakeFailure("opening '" + ToStd(to) + "'", result);
        damaged = CheckAllBlocks(*copy, arguments, checked);
    }
    u64 const before = SizeOf(from);
    u64 const after = SizeOf(to);
    Report(arguments,
           {{"streamlined", true},
            {"path", ToStd(to)},
            {"sizeBefore", before},
            {"sizeAfter", after},
            {"verified", verify && damaged.empty()}},
           "streamlined to " + Printable(ToStd(to)) + ": " + Sizes(before, after) + "\n");
    // What is damaged in it, 'archive verify' tells as a value.
    if (!damaged.empty() && !arguments.Has(Option::Json)) PrintDamage(damaged, checked);
    return damaged.empty() ? ExitDone : ExitDamaged;
}

} // namespace

int RunStreamline(Arguments const& arguments)
{
    bool const verify = !arguments.Has(Option::NoVerify);
    if (arguments.Has(Option::To) && arguments.Has(Option::Overwrite))
        throw UsageProblem{"--overwrite is for streamlining in place"};
    if (arguments.Has(Option::To)) return StreamlineTo(arguments, verify);

    Counted<Archive> const archive = OpenForWriting(arguments.At(0));
    String8 const path = archive->GetArchivePath();
    std::string const what = "streamlining '" + ToStd(path) + "'";
    u64 const before = SizeOf(path);
    bool const required = archive->RequiresStreamlining();
    if (required) {
        TemporaryFolder const temporaries(path);
        archive->SetAlwaysStreamlineOverwrite(arguments.Has(Option::Overwrite));
        auto const progress = MakeCounted<ToolProgress>(arguments);
        String8 report;
        Archive::StreamlineResult const result =
            verify ? archive->StreamlineAndVerifyFileState(report, GetAbortFlag(), progress, nullptr)
                   : archive->Streamline(GetAbortFlag(), progress, nullptr);
        progress->End();
        ThrowIfFailed(result, what, path, temporaries.GetPath());
    }
    u64 const after = SizeOf(path);
    return Report(arguments,
                  {{"streamlined", required},
                   {"path", ToStd(path)},
                   {"sizeBefore", before},
                   {"sizeAfter", after},
                   {"verified", required && verify}},
                  required ? "streamlined: " + Sizes(before, after) + "\n"
                           : std::string("nothing to do: the history holds nothing that a rewrite would drop\n"));
}

} // namespace KernelTool
