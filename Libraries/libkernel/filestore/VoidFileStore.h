#pragma once

#include "libkernel/filestore/FileStore.h"
#include "libkernel/filestore/FileStoreOut.h"

namespace Kernel {

/// A store that has nothing. Lets code that needs a store work without one.
class KERNEL_API VoidFileStore : public FileStore
{
public:
    /// The one instance of the process, which never ends.
    static VoidFileStore& GetInstance();

    bool LoadFile(String8 const& path, NonCounted<FileStoreRevision const> revision, FileStoreItem& item,
                  bool reportToCallback) override;
    bool LoadFile(String8 const& path, FileStoreItem& item) override;
    Counted<FileStoreBackData const> CreateBackData(NonCounted<FileStoreRevision const> revision,
                                                    String8 const& path) override;

protected:
    NonCounted<FileStoreRevision const> GetHeadRevisionI() const override;
    NonCounted<FileStoreRevision const> GetHeadRevisionForFileI(String8 const& path) const override;

private:
    VoidFileStore();
    ~VoidFileStore() override;
};

/// An output for a save whose delay-loaded parts are not wanted: ignores all that it is given, and has no path to give.
class KERNEL_API VoidFileStoreOut : public FileStoreOut
{
public:
    /// The one instance of the process, which never ends. Purpose is PurposeSave; there is no abort flag.
    static VoidFileStoreOut& GetInstance();

    using FileStoreOut::CreateFile;
    void CreateFile(Counted<DelayLoadHolder> holder, Counted<FileStoreCompressionHint> const& hint) override;
    void CreateFile(String8 const& path, Counted<FileStoreItem const> const& item,
                    Counted<FileStoreCompressionHint> const& hint) override;
    void DeleteFile(String8 const& path) override;
    void AddObjectToClean(Counted<FileStoreStateObject> object) override;
    void AddPostSaveObject(Counted<FileStorePostSaveInterface> object) override;
    bool GenerateIndexedPath(IndexedPathParts const& parts, NonCounted<FileStoreItem const> item,
                             NonCounted<DelayLoadHolder const> holder, String8& path) override;
    void AssignDelayLoadHolderPath(Counted<DelayLoadHolder> holder, String8 const& path) override;
    FileStore& GetFileStore() const override;

private:
    VoidFileStoreOut();
    ~VoidFileStoreOut() override;
};

} // namespace Kernel
