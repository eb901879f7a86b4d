#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

#include <type_traits>
#include <utility>

namespace Kernel {

/// Byte blocks from non-throwing operator new. Null when there is no such memory, or for a size above
/// c_maxAllocation. Any thread.
struct KERNEL_API AllocatorNew
{
    static void* Allocate(u64 size) noexcept;
    static void Free(void* block) noexcept;
};

/// Byte blocks from malloc; the same answers.
struct KERNEL_API AllocatorMalloc
{
    static void* Allocate(u64 size) noexcept;
    static void Free(void* block) noexcept;
};

/// Owner of one byte block, which goes back to the allocator it came from.
template <class Allocator>
class RawDataBaseT
{
public:
    /// No block, size 0.
    RawDataBaseT() = default;
    /// Takes @p size bytes at once, contents undefined; nothing for size 0. The size is recorded even when the memory
    /// cannot be had, and the pointer is then null: test the pointer, not the size.
    explicit RawDataBaseT(u64 size) : m_data(size ? Allocator::Allocate(size) : nullptr), m_size(size) {}
    RawDataBaseT(RawDataBaseT const&) = delete;
    RawDataBaseT& operator=(RawDataBaseT const&) = delete;
    virtual ~RawDataBaseT();

    /// The bytes, owned by this object; null if there are none.
    void* GetData() { return m_data; }
    void const* GetData() const { return m_data; }
    /// The same bytes, as u8.
    u8* GetBytes() { return static_cast<u8*>(m_data); }
    u8 const* GetBytes() const { return static_cast<u8 const*>(m_data); }
    /// Size in bytes, as it was asked for.
    u64 GetSize() const { return m_size; }

    /// Exchanges the blocks; no byte is copied.
    void Swap(RawDataBaseT& o) noexcept
    {
        std::swap(m_data, o.m_data);
        std::swap(m_size, o.m_size);
    }

private:
    void* m_data = nullptr;
    u64 m_size = 0;
};

/// A byte block that is also a @p Base: shared by reference with Countable, a plain value with VoidClass.
template <class Base, class Allocator>
class RawDataT : public Base, public RawDataBaseT<Allocator>
{
public:
    RawDataT() = default;
    /// As RawDataBaseT(size).
    explicit RawDataT(u64 size) : RawDataBaseT<Allocator>(size) {}
    /// A value block may move; a shared one stays where its owners point.
    RawDataT(RawDataT&& o) noexcept requires(!std::is_base_of_v<Countable, Base>) { this->Swap(o); }
    RawDataT& operator=(RawDataT&& o) noexcept requires(!std::is_base_of_v<Countable, Base>)
    {
        RawDataBaseT<Allocator> taken; // A third block, so that moving to itself keeps the bytes.
        taken.Swap(o);
        this->Swap(taken);
        return *this;
    }
    ~RawDataT() override;
};

extern template class KERNEL_API RawDataBaseT<AllocatorNew>;
extern template class KERNEL_API RawDataBaseT<AllocatorMalloc>;
extern template class KERNEL_API RawDataT<Countable, AllocatorNew>;
extern template class KERNEL_API RawDataT<Countable, AllocatorMalloc>;
extern template class KERNEL_API RawDataT<VoidClass, AllocatorMalloc>;

/// A shared block, handed round as Counted: thumbnails, font data, keys.
using RawData = RawDataT<Countable, AllocatorNew>;
/// A shared block that was read from an archive or a bookmark.
using RawDataMalloc = RawDataT<Countable, AllocatorMalloc>;
/// A plain value block; the serialiser swaps it into a caller's block without a copy.
using RawDataBlock = RawDataT<VoidClass, AllocatorMalloc>;

} // namespace Kernel
