#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/IDTag.h"

namespace Kernel {

class FileStoreItem;

/// A static description of a kind of item. Lives as long as the process; its address may be kept.
class KERNEL_API FileStoreItemType
{
public:
    /// Makes an empty item for Load to fill.
    using CreateFunc = Counted<FileStoreItem> (*)();

    enum Nestable : u32
    {
        NotNestable = 0,
        /// The item's Save may itself create files in the store that is saving it. Its bytes are reached through the
        /// item that contains it, so a holder of such a type never takes back data.
        IsNestableType = 1
    };
    enum Recoverable : u32
    {
        NotRecoverable = 0,
        /// A holder is made even for a path that the store no longer has, so that a load can go on without the data.
        IsRecoverableType = 1
    };

    constexpr FileStoreItemType(ClassUID uid, CreateFunc create, Nestable nestable, Recoverable recoverable)
        : m_uid(uid), m_create(create), m_nestable(nestable), m_recoverable(recoverable)
    {
    }
    FileStoreItemType(FileStoreItemType const&) = delete;
    FileStoreItemType& operator=(FileStoreItemType const&) = delete;

    ClassUID GetClassUID() const { return m_uid; }
    CreateFunc GetCreateFunc() const { return m_create; }
    bool IsNestable() const { return m_nestable == IsNestableType; }
    bool IsRecoverable() const { return m_recoverable == IsRecoverableType; }

    /// The registered type of that class, or null. Any thread.
    static FileStoreItemType const* FindFileStoreItemType(ClassUID uid);

    /// Registers a type; of two types with one ClassUID the later one stays. Make these as statics only: the map is
    /// filled before main, or while a library is being loaded, and read without a lock from then on.
    class KERNEL_API Init
    {
    public:
        explicit Init(FileStoreItemType const& type);
    };

private:
    ClassUID const m_uid;
    CreateFunc const m_create;
    Nestable const m_nestable;
    Recoverable const m_recoverable;
};

} // namespace Kernel
