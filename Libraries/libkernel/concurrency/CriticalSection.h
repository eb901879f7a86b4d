#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Types.h"
#include "libkernel/platform/Lock.h"

#include <memory>

namespace Kernel {

/// Place of a lock in the order in which a thread may take locks: never one of a lower rank than one it holds, unless
/// it holds that lock already. Builds with assertions check it. Unranked locks stand outside the order.
enum class LockRank : u16
{
    Unranked = 0
};

/// Re-entrant lock. Blocks in the kernel at once when another thread holds it. Its state lies on the heap, so that the
/// owner may move the object about, though not while a thread is just taking it.
class KERNEL_API CriticalSection
{
public:
    CriticalSection() : CriticalSection(LockRank::Unranked) {}
    explicit CriticalSection(LockRank rank);
    virtual ~CriticalSection();
    CriticalSection(CriticalSection&& o) noexcept = default;
    CriticalSection& operator=(CriticalSection&& o) noexcept = default;

    /// Returns when this thread holds the lock. Each acquire wants its release, on the same thread.
    void AcquireLock() const { m_lock->Acquire(); }
    void ReleaseLock() const { m_lock->Release(); }
    /// Takes the lock if no other thread holds it; false if one does.
    bool TryAcquireLock() const { return m_lock->TryAcquire(); }

    /// For assertions in operations whose caller must hold the lock.
    bool IsHeldByCurrentThread() const { return m_lock->IsHeldByCurrentThread(); }

private:
    std::unique_ptr<Platform::RecursiveLock> m_lock;
};

/// Re-entrant lock for short stretches: tries 4,000 times before it sleeps. Constant-initialised, so one may guard a
/// static from any static initialiser on.
class KERNEL_API CriticalSectionSpin
{
public:
    static constexpr u16 c_spinCount = 4000;

    constexpr CriticalSectionSpin() : m_lock(c_spinCount, 0) {}
    constexpr explicit CriticalSectionSpin(LockRank rank) : m_lock(c_spinCount, static_cast<u16>(rank)) {}

    void AcquireLock() const { m_lock.Acquire(); }
    void ReleaseLock() const { m_lock.Release(); }
    bool IsHeldByCurrentThread() const { return m_lock.IsHeldByCurrentThread(); }

private:
    mutable Platform::RecursiveLock m_lock;
};

/// A lock that several owners share.
class KERNEL_API CountableCriticalSection : public Countable, public CriticalSection
{
public:
    using CriticalSection::CriticalSection;
    CountableCriticalSection();

protected:
    ~CountableCriticalSection() override;
};

/// Holds a lock for a scope. T is anything with AcquireLock and ReleaseLock.
template <class T>
class [[nodiscard]] LockScope
{
public:
    explicit LockScope(T& lock) : m_lock(&lock) { m_lock->AcquireLock(); }
    ~LockScope() { Release(); }
    LockScope(LockScope const&) = delete;
    LockScope& operator=(LockScope const&) = delete;

    /// Lets go before the scope ends; a second call does nothing.
    void Release()
    {
        if (m_lock) m_lock->ReleaseLock();
        m_lock = nullptr;
    }

private:
    T* m_lock;
};

using CriticalSectionScope = LockScope<CriticalSection const>;
using CriticalSectionSpinScope = LockScope<CriticalSectionSpin const>;

} // namespace Kernel
