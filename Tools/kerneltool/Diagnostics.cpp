#include "Diagnostics.h"

#include "Output.h"
#include "libkernel/archive/ArchiveExceptions.h"
#include "libkernel/core/Exception.h"
#include "libkernel/filestore/BackstoreException.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"

#include <cstdio>
#include <new>

namespace KernelTool {

using namespace Kernel;

namespace {

/// One number of a result, its name, and what the person can do. Null: nothing to add.
struct ResultName
{
    int number;
    char const* name;
    char const* advice;
};

constexpr char c_createFirst[] = "Make the document first with 'kerneltool archive create'.";
constexpr char c_damaged[] = "The document is damaged: work on a copy, and look for an older one.";
constexpr char c_rights[] = "Look at the rights of the file and of its folder.";
constexpr char c_oneWriter[] = "Another program has it open for writing, or it is read-only: try again later.";
constexpr char c_space[] = "Free some space and run the command again; the file is as its last commit left it.";
constexpr char c_master[] = "The scratch file names its master by path: put the master back there.";
constexpr char c_taken[] = "Something stands at that path: choose another or move it away.";

constexpr ResultName c_openResults[] = {
    {0, "OpenOk", nullptr},
    {1, "OpenBadPath", "Give the path of a file."},
    {2, "OpenNotFound", c_createFirst},
    {3, "OpenIOError", "Look at the disk; the file could not be read."},
    {4, "OpenInUse", c_oneWriter},
    {5, "OpenLinkedNotFound", c_master},
    {6, "OpenLinkMismatch", "The master has been saved without this scratch file, which belongs to an older state."},
    {7, "OpenReadOnlyArchive", c_oneWriter},
    {8, "OpenNotArchive", "The file is of another format."},
    {9, "OpenTooOld", nullptr},
    {10, "OpenTooNew", "A newer version of this program wrote it."},
    {11, "OpenWrongType", nullptr},
    {12, "OpenCorrupt", c_damaged},
    {13, "OpenBadInfo", c_damaged},
    {14, "OpenTruncated", c_damaged},
    {15, "OpenNoMemory", nullptr},
    {16, "OpenNoTemporary", nullptr},
    {17, "OpenAccessDenied", c_rights},
    {18, "OpenLinkedAccessDenied", c_rights},
    {19, "OpenLocked", c_oneWriter},
    {20, "OpenLinkedLocked", c_oneWriter},
    {21, "OpenNotPermitted", c_rights},
    {22, "OpenReadOnlyVolume", "Copy the document to a volume that can be written."},
    {23, "OpenTimedOut", nullptr},
    {24, "OpenRefused", nullptr},
    {25, "OpenMoveFailed", nullptr},
    {26, "OpenIsDirectory", "Give the path of a file, not of a folder."},
    {27, "OpenTooManyFiles", nullptr},
    {28, "OpenTooLarge", nullptr},
    {29, "OpenNoSpace", c_space},
    {30, "OpenNotSupported", nullptr},
    {31, "OpenUnknownError", nullptr},
};

constexpr ResultName c_createResults[] = {
    {0, "Ok", nullptr},
    {1, "BadPath", "Give the path of a file."},
    {2, "CouldNotCreate", nullptr},
    {3, "ChangesNotAllowed", nullptr},
    {4, "InUse", c_oneWriter},
    {5, "ExistsReadOnly", c_taken},
    {6, "WriteFailed", "Look at the disk and whether it is full."},
    {7, "HasScratchFile", "The document has a scratch file already."},
    {8, "IsThrowAway", nullptr},
    {9, "NoMasterPath", nullptr},
    {10, "AccessDenied", c_rights},
    {11, "NotPermitted", c_rights},
    {12, "ReadOnlyVolume", "Choose a volume that can be written."},
    {13, "TimedOut", nullptr},
    {14, "Refused", nullptr},
    {15, "NoMemory", nullptr},
    {16, "IsDirectory", "Give the path of a file, not of a folder."},
    {17, "TooManyFiles", nullptr},
    {18, "TooLarge", nullptr},
    {19, "NoSpace", c_space},
    {20, "NotSupported", nullptr},
};

constexpr ResultName c_sessionResults[] = {
    {0, "SessionOk", nullptr},
    {1, "SessionHandleInUse", nullptr},
    {2, "SessionNotAtHead", nullptr},
    {3, "SessionActive", nullptr},
    {4, "SessionFileBad", nullptr},
    {5, "SessionNoMaster", "Save to the scratch file with --scratch."},
    {6, "SessionNoScratch", "Name the scratch file, or add one with 'kerneltool archive scratch'."},
    {7, "SessionReadOnly", c_oneWriter},
    {8, "SessionMoved", nullptr},
    {9, "SessionFileUnusable", "The file cannot be written, or is of version 7 and was saved once already."},
    {10, "SessionNoMemory", nullptr},
};

constexpr ResultName c_streamlineResults[] = {
    {0, "StreamlineDone", nullptr},
    {1, "StreamlineAborted", nullptr},
    {2, "StreamlineFailed", "The document is as it was; 'kerneltool archive verify' says whether it is damaged."},
    {3, "StreamlineNotCreated", c_rights},
    {4, "StreamlineNoAccess", "The document is as it was; look at the disk and whether it is full."},
    {6, "StreamlineNotVerified", "The document is as it was: what was written in its place did not match."},
    {7, "StreamlineOverwriteFailed", nullptr},
    {8, "StreamlineNoSpace", nullptr},
};

constexpr ResultName c_verifyResults[] = {
    {0, "VerifyMatch", nullptr},
    {1, "VerifyNotRun", "The save was made; 'kerneltool archive verify' checks it."},
    {2, "VerifyMismatch", "What lies in the file is not what was saved: check the disk, and go back to a copy."},
};

constexpr ResultName c_blockChecks[] = {
    {0, "Ok", nullptr},           {1, "Unreadable", nullptr}, {2, "BadTag", nullptr},
    {3, "BadStoredCRC", nullptr}, {4, "BadData", nullptr},    {5, "BadCRC", nullptr},
};

constexpr ResultName c_fileResults[] = {
    {0, "Opened", nullptr},
    {1, "OpenedToo", nullptr},
    {2, "NotFound", "Look at the path: nothing stands there."},
    {3, "Exists", c_taken},
    {4, "InUse", nullptr},
    {5, "AccessDenied", c_rights},
    {6, "NotPermitted", c_rights},
    {7, "Locked", nullptr},
    {8, "TimedOut", nullptr},
    {9, "Refused", nullptr},
    {11, "ReadOnlyVolume", nullptr},
    {12, "NoMemory", nullptr},
    {13, "IsDirectory", "Give a file; only archive put takes a folder, by --tree."},
    {14, "TooManyFiles", nullptr},
    {15, "TooLarge", nullptr},
    {16, "NoSpace", c_space},
    {17, "NotSupported", nullptr},
    {18, "Other", nullptr},
};

constexpr ResultName c_fileReasons[] = {
    {0, "NoError", nullptr},           {1, "FileHandleLost", nullptr}, {2, "AccessDenied", c_rights},
    {3, "PermissionDenied", c_rights}, {4, "OutOfSpace", c_space},     {5, "SocketNotConnected", nullptr},
    {6, "NotAllowed", nullptr},        {7, "Other", nullptr},
};

constexpr ResultName c_archiveReasons[] = {
    {0, "FileError", nullptr},
    {1, "OutOfSpace", c_space},
    {2, "OtherWriter", "Another program has saved the document meanwhile; open it afresh."},
    {3, "GuardUnreadable", c_damaged},
    {4, "PermissionDenied", c_rights},
    {5, "AccessDenied", c_rights},
    {6, "OperationNotAllowed", nullptr},
    {7, "Other", nullptr},
    {8, "ReadFailed", "Look at the disk; stored data could not be read."},
};

template <size_t n>
Failure FromTable(ResultName const (&table)[n], std::string const& what, int number)
{
    for (ResultName const& row : table)
        if (row.number == number) return {what, row.name, number, row.advice ? row.advice : "", ExitFailed};
    return {what, "Unknown", number, "", ExitFailed};
}

} // namespace

Failure MakeFailure(std::string const& what, Archive::OpenResult result)
{
    return FromTable(c_openResults, what, static_cast<int>(result));
}

Failure MakeFailure(std::string const& what, Archive::CreateResult const& result)
{
    Failure failure = FromTable(c_createResults, what, static_cast<int>(result.GetCode()));
    if (failure.advice.empty()) failure.advice = ToStd(result.GetErrorMessage());
    return failure;
}

Failure MakeFailure(std::string const& what, Archive::CreateSessionResult result)
{
    return FromTable(c_sessionResults, what, static_cast<int>(result));
}

Failure MakeFailure(std::string const& what, Archive::StreamlineResult result)
{
    return FromTable(c_streamlineResults, what, static_cast<int>(result));
}

Failure MakeFailure(std::string const& what, Archive::VerifyResult result)
{
    return FromTable(c_verifyResults, what, static_cast<int>(result));
}

Failure MakeFailure(std::string const& what, Archive::BlockCheck result)
{
    return FromTable(c_blockChecks, what, static_cast<int>(result));
}

Failure MakeFailure(std::string const& what, File::OpenUnmanagedResult result)
{
    return FromTable(c_fileResults, what, static_cast<int>(result));
}

Failure MakeFailure(std::string const& what, FileIOException::Reason reason)
{
    return FromTable(c_fileReasons, what, static_cast<int>(reason));
}

char const* GetName(Archive::OpenResult result)
{
    for (ResultName const& row : c_openResults)
        if (row.number == static_cast<int>(result)) return row.name;
    return "Unknown";
}

Failure DescribeCurrentException(std::string const& what)
{
    try {
        throw;
    } catch (Failure const& failure) {
        return failure;
    } catch (AbortException const&) {
        return {what, "Stopped", ExitInterrupted, "The file is as its last commit left it.", ExitInterrupted};
    } catch (ArchiveFileException const& e) {
        return FromTable(c_archiveReasons, what, static_cast<int>(e.GetReason()));
    } catch (ArchiveBackingException const&) {
        return FromTable(c_archiveReasons, what, static_cast<int>(ArchiveFileException::Reason::ReadFailed));
    } catch (ArchiveException const&) {
        // All that is left is damage.
        return MakeFailure(what, Archive::OpenCorrupt);
    } catch (FileIOException const& e) {
        return MakeFailure(what, e.GetReason());
    } catch (OutStream::WriteException const&) {
        return FromTable(c_createResults, what, static_cast<int>(Archive::CreateResult::Code::WriteFailed));
    } catch (InStream::ReadException const&) {
        return MakeFailure(what, Archive::OpenTruncated);
    } catch (MemoryException const&) {
        return MakeFailure(what, Archive::OpenNoMemory);
    } catch (std::bad_alloc const&) {
        return MakeFailure(what, Archive::OpenNoMemory);
    } catch (Exception const&) {
        return MakeFailure(what, Archive::OpenUnknownError);
    } catch (std::exception const& e) {
        Failure failure = MakeFailure(what, Archive::OpenUnknownError);
        failure.advice = e.what();
        return failure;
    }
}

void PrintFailure(Failure const& failure)
{
    std::string text = "kerneltool: " + Printable(failure.what) + " failed: " + failure.name + " (" +
                       std::to_string(failure.number) + ")\n";
    if (!failure.advice.empty()) {
        text += Printable(failure.advice);
        text += '\n';
    }
    std::fflush(stdout);
    std::fputs(text.c_str(), stderr);
}

} // namespace KernelTool
