#include "libkernel/filesystem/TempFile.h"

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/concurrency/TimeStamp.h"
#include "libkernel/core/Endian.h"
#include "libkernel/filesystem/FileEnumerator.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/filesystem/Path.h"
#include "libkernel/filesystem/internal/SystemFiles.h"
#include "libkernel/streams/FileInOutStream.h"
#include "libkernel/streams/FileOutStream.h"

#include <charconv>
#include <iterator>

namespace Kernel {

using FileDetail::OpenFile;
using Result = File::OpenUnmanagedResult;

namespace {

constexpr int c_maxFailures = 1000; // In a row, before a folder counts as one that takes no files.

struct TempRecord
{
    CriticalSectionSpin lock;
    String8 path;
    String8 second;
    u64 counter = static_cast<u64>(TimeStamp::GetCurrent().GetValue());
};

// Never destroyed: threads may still ask for names while the process ends.
TempRecord& GetRecord()
{
    static TempRecord* const s_record = new TempRecord;
    return *s_record;
}

/// The folder that new names go into; empty if it can't be had.
String8 GetFolder(TempRecord const& record, bool second)
{
    if (record.path.IsEmpty()) return String8();
    return second ? record.second : record.path;
}

/// A path that nobody else gets, empty without a folder. The lock is held for the count alone: what is done with the
/// name may wait for a slow volume, and others need names meanwhile.
String8 NextPath(String8 const& extension, bool second)
{
    TempRecord& record = GetRecord();
    CriticalSectionSpinScope const scope(record.lock);
    String8 const folder = GetFolder(record, second);
    if (folder.IsEmpty()) return String8();
    char digits[16];
    auto const end = std::to_chars(digits, std::end(digits), ++record.counter, 16).ptr;
    String8 name(digits, static_cast<int>(end - digits));
    if (!extension.IsEmpty()) {
        if (extension[0] != '.') name.Append('.');
        name.Append(extension);
    }
    return FileDetail::AppendElement(folder, name);
}

/// Tries names until @p make gives a stream, or fails in a way that the next name can't mend.
template <class Stream, class Make>
Counted<Stream> MakeFile(String8& out, String8 const& extension, bool second, Make const& make)
{
    for (int failures = 0; failures < c_maxFailures; ++failures) {
        String8 const path = NextPath(extension, second);
        if (path.IsEmpty()) return nullptr;
        Result result = Result::Other;
        if (Counted<Stream> stream = make(path, result)) {
            out = path;
            return stream;
        }
        if (result == Result::TooManyFiles || result == Result::NoSpace) return nullptr;
    }
    return nullptr;
}

enum class Mark
{
    Unknown, // The file could not be asked for a reason that may pass.
    Unset,
    Set
};

// The first 12 bytes of an archive file, little-endian:
//
//   offset  size  field
//        0     4  magic, the bytes 00 FF 4B 41
//        4     2  version, 7 to 11
//        6     2  flags; bit 2 is the mid-streamline mark
//        8     4  kind of document
Mark GetMark(String8 const& path)
{
    constexpr u32 c_magic = 0x414BFF00;
    constexpr u16 c_firstVersion = 7;
    constexpr u16 c_lastVersion = 11;
    constexpr u16 c_midStreamline = 1u << 2;
    u8 header[12];
    OpenFile file;
    FileDetail::Failure const failure = FileDetail::GetFailure(file.Open(path, {.read = true}));
    if (failure == FileDetail::Failure::TooManyOpen || failure == FileDetail::Failure::AccessDenied)
        return Mark::Unknown;
    if (failure != FileDetail::Failure::None) return Mark::Unset;
    Platform::IoResult const read = Platform::GetFileCalls().readAt(file.Get(), header, sizeof header, 0);
    if (read.error != 0) return Mark::Unknown;
    if (read.count != sizeof header) return Mark::Unset;
    u16 const version = LoadLittleEndian<u16>(header + 4);
    bool const isSet = LoadLittleEndian<u32>(header) == c_magic && version >= c_firstVersion &&
                       version <= c_lastVersion && (LoadLittleEndian<u16>(header + 6) & c_midStreamline) != 0;
    return isSet ? Mark::Set : Mark::Unset;
}

} // namespace

void TempFile::SetTempPath(String8 const& path)
{
    GetRecord().path = path;
    FileSystem::DeleteFilesFromFolder(path);
}

void TempFile::SetTempPath(String8 const& path, String8 const& secondPath, std::vector<String8>& rescued)
{
    SetTempPath(path);
    GetRecord().second = secondPath;
    auto const entries = FileEnumerator::Create(secondPath, true);
    if (!entries) return;
    for (FileEnumerator::PathRec const& entry : entries->GetPaths()) {
        if (entry.kind != FileEnumerator::Kind::File) continue;
        Mark const mark = GetMark(entry.path);
        if (mark == Mark::Set) rescued.push_back(entry.path);
        if (mark == Mark::Unset) FileSystem::Delete(entry.path, 0);
    }
}

bool TempFile::HaveTempPath()
{
    return !GetRecord().path.IsEmpty();
}

bool TempFile::GenerateTempFilePath(String8& out, String8 const& extension, bool second)
{
    // Opening alone would not notice a link that leads nowhere, and whoever makes the file would follow it.
    String8 path = NextPath(extension, second);
    while (!path.IsEmpty() && FileDetail::IsTaken(path)) path = NextPath(extension, second);
    if (path.IsEmpty()) return false;
    out = path;
    return true;
}

Counted<FileInOutStream> TempFile::GenerateTempInOutFile(String8& out, String8 const& extension, bool second)
{
    return MakeFile<FileInOutStream>(out, extension, second, [](String8 const& path, Result& result) {
        return FileInOutStream::Create(FileDetail::ToSystem(path), File::ShareMode::DenyNone, result, nullptr, true);
    });
}

Counted<FileOutStream> TempFile::GenerateTempOutFile(String8& out, String8 const& extension, bool second)
{
    return MakeFile<FileOutStream>(out, extension, second, [](String8 const& path, Result& result) {
        // The name is claimed first: creating the stream would empty, or follow, what stands there.
        OpenFile claim;
        int const error = claim.Open(path, {.write = true, .create = true, .exclusive = true, .noFollow = true});
        if (error != 0) {
            result = File::TranslateOpenError(error, FileDetail::ToSystem(path));
            return Counted<FileOutStream>();
        }
        auto stream = FileOutStream::Create(FileDetail::ToSystem(path), File::ShareMode::DenyNone, result, nullptr);
        if (!stream) FileSystem::Delete(path, 0);
        return stream;
    });
}

bool TempFile::IsMidStreamlineFile(String8 const& path)
{
    return GetMark(path) == Mark::Set;
}

} // namespace Kernel
