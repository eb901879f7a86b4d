#include "Diagnostics.h"
#include "OpenedArchive.h"
#include "ProgressBar.h"
#include "Verbs.h"
#include "libkernel/core/Exception.h"
#include "libkernel/platform/PlatformFile.h"

#include <cerrno>

// Items as files. The paths come from the document, so nothing about them is trusted: every folder below the target is
// looked at without following links, and a file appears under its name only once its last byte was checked.

namespace KernelTool {

using namespace Kernel;
using Platform::FileKind;

namespace {

/// The elements of an item path; false if it is absolute, climbs or names no file.
bool SplitSafely(std::string const& item, std::vector<std::string>& elements)
{
    if (item.empty() || item.front() == '/' || item.back() == '/' || item.find('\0') != std::string::npos) return false;
    std::string element;
    for (size_t i = 0; i <= item.size(); ++i) {
        if (i < item.size() && item[i] != '/') {
            element += item[i];
            continue;
        }
        if (element == "..") return false;
        if (!element.empty() && element != ".")
            elements.push_back(element);
        else if (i == item.size())
            return false;
        element.clear();
    }
    return true;
}

FileKind KindOf(std::string const& path, bool followLinks)
{
    Platform::FileInfo info;
    return Platform::GetFileCalls().stat(path.c_str(), followLinks, info) == 0 ? info.kind : FileKind::None;
}

Failure FileFailure(std::string const& what, int error, std::string const& path)
{
    return MakeFailure(what, File::TranslateOpenError(error, path.c_str()));
}

/// Makes the target and what is missing above it. Links are the caller's own choice here.
void MakeTarget(std::string const& path)
{
    if (KindOf(path, true) == FileKind::Folder) return;
    for (size_t at = path.find('/', 1);; at = path.find('/', at + 1)) {
        std::string const folder = path.substr(0, at);
        if (KindOf(folder, true) != FileKind::Folder) {
            int const error = Platform::GetFileCalls().makeFolder(folder.c_str());
            if (error != 0 && error != EEXIST) throw FileFailure("making folder '" + folder + "'", error, folder);
        }
        if (at == std::string::npos) break;
    }
    if (KindOf(path, true) != FileKind::Folder) throw FileFailure("making folder '" + path + "'", ENOTDIR, path);
}

/// A file of a passing name in the folder of its target, which it replaces when it is complete.
class PartFile
{
public:
    PartFile(std::string const& folder, std::string const& what) : m_what(what)
    {
        Platform::OpenFlags flags;
        flags.write = flags.create = flags.exclusive = flags.noFollow = true;
        int error = EEXIST;
        for (int n = 0; error == EEXIST && n < 10000; ++n) {
            m_path = folder + "/.kerneltool-part" + std::to_string(n);
            error = Platform::GetFileCalls().open(m_path.c_str(), flags, m_handle);
        }
        if (error != 0) throw FileFailure(what, error, m_path);
    }
    PartFile(PartFile const&) = delete;
    PartFile& operator=(PartFile const&) = delete;
    ~PartFile()
    {
        if (m_handle != Platform::c_noHandle) Platform::GetFileCalls().close(m_handle);
        if (!m_placed) Platform::GetFileCalls().unlink(m_path.c_str());
    }

    void Write(void const* bytes, u64 count)
    {
        Platform::IoResult const result = Platform::GetFileCalls().write(m_handle, bytes, count);
        if (result.count != count) throw MakeFailure(m_what, FileIOException::FromError(result.error));
    }
    void PlaceAt(std::string const& path)
    {
        int error = Platform::GetFileCalls().close(m_handle);
        m_handle = Platform::c_noHandle;
        if (error == 0) error = Platform::GetFileCalls().rename(m_path.c_str(), path.c_str());
        if (error != 0) throw MakeFailure(m_what, FileIOException::FromError(error));
        m_placed = true;
    }

private:
    std::string const m_what;
    std::string m_path;
    Platform::FileHandle m_handle = Platform::c_noHandle;
    bool m_placed = false;
};

Failure Refusal(std::string const& item, char const* advice)
{
    Failure failure = MakeFailure("extracting '" + item + "'", File::OpenUnmanagedResult::NotPermitted);
    failure.advice = advice;
    return failure;
}

void ExtractItem(Archive& archive, std::string const& target, std::string const& item, LongWork& work)
{
    std::vector<std::string> elements;
    if (!SplitSafely(item, elements)) throw Refusal(item, "The path leads out of the target folder.");
    std::string path = target;
    for (size_t i = 0; i + 1 < elements.size(); ++i) {
        path += "/" + elements[i];
        FileKind const kind = KindOf(path, false);
        if (kind == FileKind::Folder) continue;
        if (kind != FileKind::None) throw Refusal(item, "Something that is no folder stands on the way.");
        int const error = Platform::GetFileCalls().makeFolder(path.c_str());
        if (error != 0) throw FileFailure("making folder '" + path + "'", error, path);
    }
    std::string const file = path + "/" + elements.back();
    FileKind const kind = KindOf(file, false);
    if (kind != FileKind::None && kind != FileKind::File)
        throw Refusal(item, "A link or folder stands at the file's place.");
    PartFile part(path, "writing '" + file + "'");
    ReadItem(archive, String8(std::string_view(item)), [&](void const* bytes, u64 count) {
        part.Write(bytes, count);
        work.Advance(count);
    });
    part.PlaceAt(file);
}

} // namespace

int RunExtract(Arguments const& arguments)
{
    Counted<Archive> const archive = OpenForReading(arguments);
    std::vector<std::string> items(arguments.positional.begin() + 2, arguments.positional.end());
    RequireItems(*archive, items);
    if (items.empty()) {
        std::vector<String8> paths;
        archive->GetFileList(paths);
        for (String8 const& path : paths) items.push_back(ToStd(path));
    }
    std::string target = arguments.positional[1];
    while (target.size() > 1 && target.back() == '/') target.pop_back();
    if (target.empty()) throw UsageProblem{"the target folder is empty"};
    MakeTarget(target);

    u64 total = 0;
    for (std::string const& item : items) {
        Archive::FileRevision entry;
        Counted<Archive::Revision const> revision;
        if (archive->GetFileRevision(String8(std::string_view(item)), entry, revision)) total += entry.fileSize;
    }
    Json written = Json::array();
    Json skipped = Json::array();
    {
        LongWork work("Extracting", total, arguments);
        for (std::string const& item : items) {
            try {
                ExtractItem(*archive, target, item, work);
                written.push_back(item);
            } catch (Failure const& failure) {
                if (failure.status == ExitInterrupted) throw;
                PrintFailure(failure);
                skipped.push_back(item);
            }
        }
    }
    if (arguments.Has(Option::Json))
        PrintJson({{"written", written}, {"skipped", skipped}});
    else
        Print(std::to_string(written.size()) + " items written" +
              (skipped.empty() ? "" : ", " + std::to_string(skipped.size()) + " skipped") + "\n");
    return skipped.empty() ? ExitDone : ExitFailed;
}

} // namespace KernelTool
