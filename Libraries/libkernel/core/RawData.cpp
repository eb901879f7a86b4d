#include "libkernel/core/RawData.h"

#include "libkernel/core/Limits.h"

#include <cstdlib>
#include <new>

namespace Kernel {

void* AllocatorNew::Allocate(u64 size) noexcept
{
    return size <= c_maxAllocation ? ::operator new(size, std::nothrow) : nullptr;
}

void AllocatorNew::Free(void* block) noexcept
{
    ::operator delete(block);
}

void* AllocatorMalloc::Allocate(u64 size) noexcept
{
    return size <= c_maxAllocation ? std::malloc(size) : nullptr;
}

void AllocatorMalloc::Free(void* block) noexcept
{
    std::free(block);
}

template <class Allocator>
RawDataBaseT<Allocator>::~RawDataBaseT()
{
    Allocator::Free(m_data);
}

template <class Base, class Allocator>
RawDataT<Base, Allocator>::~RawDataT() = default;

template class RawDataBaseT<AllocatorNew>;
template class RawDataBaseT<AllocatorMalloc>;
template class RawDataT<Countable, AllocatorNew>;
template class RawDataT<Countable, AllocatorMalloc>;
template class RawDataT<VoidClass, AllocatorMalloc>;

} // namespace Kernel
