#include "libkernel/concurrency/CriticalSection.h"

namespace Kernel {

CriticalSection::CriticalSection(LockRank rank)
    : m_lock(std::make_unique<Platform::RecursiveLock>(u16{0}, static_cast<u16>(rank)))
{
}

CriticalSection::~CriticalSection() = default;

CountableCriticalSection::CountableCriticalSection() = default;
CountableCriticalSection::~CountableCriticalSection() = default;

} // namespace Kernel
