#include "libkernel/filestore/FileStoreItemType.h"

#include <unordered_map>

namespace Kernel {

namespace {

// Made at first use, since the registrars of other sources may run before this one's statics. Never destroyed: items
// are still found while the process ends.
std::unordered_map<ClassUID, FileStoreItemType const*>& GetTypes()
{
    static auto& types = *new std::unordered_map<ClassUID, FileStoreItemType const*>;
    return types;
}

} // namespace

FileStoreItemType const* FileStoreItemType::FindFileStoreItemType(ClassUID uid)
{
    auto const& types = GetTypes();
    auto const found = types.find(uid);
    return found == types.end() ? nullptr : found->second;
}

FileStoreItemType::Init::Init(FileStoreItemType const& type)
{
    GetTypes()[type.GetClassUID()] = &type;
}

} // namespace Kernel
