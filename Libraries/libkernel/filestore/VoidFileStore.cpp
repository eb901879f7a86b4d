#include "libkernel/filestore/VoidFileStore.h"

namespace Kernel {

VoidFileStore::VoidFileStore() = default;
VoidFileStore::~VoidFileStore() = default;

// Never destroyed, so that statics that are destroyed late may still use it; the reference marks it as a living store.
VoidFileStore& VoidFileStore::GetInstance()
{
    static VoidFileStore& instance = *Counted<VoidFileStore>(new VoidFileStore).Detach();
    return instance;
}

bool VoidFileStore::LoadFile(String8 const&, NonCounted<FileStoreRevision const>, FileStoreItem&, bool)
{
    return false;
}

bool VoidFileStore::LoadFile(String8 const&, FileStoreItem&)
{
    return false;
}

Counted<FileStoreBackData const> VoidFileStore::CreateBackData(NonCounted<FileStoreRevision const>, String8 const&)
{
    return nullptr;
}

NonCounted<FileStoreRevision const> VoidFileStore::GetHeadRevisionI() const
{
    return nullptr;
}

NonCounted<FileStoreRevision const> VoidFileStore::GetHeadRevisionForFileI(String8 const&) const
{
    return nullptr;
}

VoidFileStoreOut::VoidFileStoreOut() : FileStoreOut(PurposeSave, nullptr, Lifetime::Process) {}
VoidFileStoreOut::~VoidFileStoreOut() = default;

VoidFileStoreOut& VoidFileStoreOut::GetInstance()
{
    static VoidFileStoreOut& instance = *new VoidFileStoreOut;
    return instance;
}

void VoidFileStoreOut::CreateFile(Counted<DelayLoadHolder>, Counted<FileStoreCompressionHint> const&) {}

void VoidFileStoreOut::CreateFile(String8 const&, Counted<FileStoreItem const> const&,
                                  Counted<FileStoreCompressionHint> const&)
{
}

void VoidFileStoreOut::DeleteFile(String8 const&) {}

void VoidFileStoreOut::AddObjectToClean(Counted<FileStoreStateObject>) {}

void VoidFileStoreOut::AddPostSaveObject(Counted<FileStorePostSaveInterface>) {}

bool VoidFileStoreOut::GenerateIndexedPath(IndexedPathParts const&, NonCounted<FileStoreItem const>,
                                           NonCounted<DelayLoadHolder const>, String8&)
{
    return false;
}

void VoidFileStoreOut::AssignDelayLoadHolderPath(Counted<DelayLoadHolder>, String8 const&) {}

FileStore& VoidFileStoreOut::GetFileStore() const
{
    return VoidFileStore::GetInstance();
}

} // namespace Kernel
