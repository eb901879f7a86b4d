#pragma once

#include "CommandLine.h"
#include "libkernel/archive/ArchiveSession.h"
#include "libkernel/filestore/FileStoreCompressionHint.h"

#include <vector>

namespace KernelTool {

/// What the options of put and rm ask for.
struct WriteOptions
{
    explicit WriteOptions(Arguments const& arguments);

    Kernel::Archive::SessionType type = Kernel::Archive::SessionTypeFull;
    bool scratch = false;
    bool verify = false;
    Kernel::Counted<Kernel::FileStoreCompressionHint> hint; ///< Null: store the bytes as they are.
    std::vector<Kernel::u8> userData;
};

/// One save of one file of a document; dropped unless it is committed. Carries the thumbnails over, which a save that
/// says nothing about them would lose.
class WriteSession
{
public:
    /// Throws Failure if there can be no session.
    WriteSession(Kernel::Archive& archive, Kernel::Archive::SessionType type, bool scratch);

    Kernel::ArchiveSession* operator->() const { return m_handle.operator->(); }
    /// Throws Failure or what the archive throws; AbortException if Ctrl-C came before the save was made. With @p
    /// verify the tables are read back before anybody else can save; a difference is a Failure with the status for
    /// damage.
    void Commit(bool verify);

private:
    Kernel::u32 GetSaveCount() const;

    Kernel::Archive& m_archive;
    Kernel::Archive::ArchiveChoice const m_file;
    Kernel::ArchiveSessionHandle m_handle;
    Kernel::u32 m_saveCount = 0;
};

/// A whole file of at most 4 GiB in memory. Throws Failure.
std::vector<Kernel::u8> ReadWholeFile(Kernel::String8 const& path);

} // namespace KernelTool
