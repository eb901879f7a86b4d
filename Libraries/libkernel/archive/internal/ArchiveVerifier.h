#pragma once

#include "libkernel/archive/internal/ArchiveImpl.h"

#include <map>

namespace Kernel {

class ArchiveComparison;

/// Reads an archive's files back and compares them with what it holds; what does not match is copied aside.
class ArchiveVerifier
{
public:
    /// Both files. The caller holds the session lock.
    static Archive::VerifyResult VerifyFileState(ArchiveImpl& impl, String8& report);
    /// A compact file that was just written to @p path, against what its writer has noted in @p data and against the
    /// archive. The caller holds the session lock.
    static Archive::VerifyResult VerifyStreamlinedFileState(ArchiveImpl& impl, Archive::ArchiveFile& file,
                                                            String8 const& path, Archive::StreamlineData const& data,
                                                            String8& report);

    /// Paths that should be there; true for those that were deleted.
    using MissingMap = std::map<String8, bool>;

    // ArchiveShunt.cpp. Nothing here fails but in what @p report says; see Archive::SetShuntPath.
    static void ShuntDeadFiles(ArchiveImpl& impl, String8 const& message, String8& report);
    static void ShuntDeadFiles(ArchiveImpl& impl, MissingMap const& missing, String8& report);
    static void ShuntDeadStreamlineFiles(ArchiveImpl& impl, String8 const& streamlinePath, String8 const& message,
                                         String8& report);

private:
    friend class ArchiveComparison;

    static Archive::ArchiveFile const* FileOf(Archive::Revision const& revision);
    static void CompareFileState(ArchiveImpl& impl, ArchiveComparison& comparison);
    static void CompareStreamlined(ArchiveImpl& impl, Archive::ArchiveFile& file, Archive::StreamlineData const& data,
                                   ArchiveComparison& comparison);
    static void CompareWithHead(ArchiveImpl& impl, ArchiveLoadData const& read, ArchiveComparison& comparison);
    static bool ShuntDeadFilesI(ArchiveImpl& impl, String8 const& base, String8 log);
};

} // namespace Kernel
