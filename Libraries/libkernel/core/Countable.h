#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

#include <atomic>
#include <cstddef>
#include <functional>
#include <type_traits>
#include <utility>

namespace Kernel {

/// Root of everything that is shared by reference. A new object has count 0; the first Counted that takes it brings it
/// to 1, and the Release that finds 1 destroys it. An object that no Counted ever takes is destroyed by nobody.
///
/// Stream classes and Serialisable inherit it virtually, because they meet in diamonds. Any thread may retain and
/// release.
class KERNEL_API Countable
{
public:
    Countable() = default;
    /// Copies share nothing: the count belongs to the object, not to its value.
    Countable(Countable const&) : m_count(0) {}
    Countable& operator=(Countable const&) { return *this; }

    void Retain() const { m_count.fetch_add(1, std::memory_order_relaxed); }
    void Release() const
    {
        if (m_count.fetch_sub(1, std::memory_order_acq_rel) == 1) delete this;
    }

    /// Retains unless the count is 0, and says whether it did. For owners of plain pointers that the object takes back
    /// in its destructor, under a lock that the caller holds: an object at 0 is being destroyed, or nobody has taken it
    /// yet.
    [[nodiscard]] bool RetainIfAlive() const
    {
        i32 count = m_count.load(std::memory_order_relaxed);
        while (count > 0)
            if (m_count.compare_exchange_weak(count, count + 1, std::memory_order_acquire, std::memory_order_relaxed))
                return true;
        return false;
    }

    /// The count at this moment; meaningful only where the caller knows who else can hold the object.
    i32 GetReferenceCount() const { return m_count.load(std::memory_order_acquire); }

protected:
    virtual ~Countable();

private:
    mutable std::atomic<i32> m_count{0};
};

/// Empty base where a template wants a base class but no counting is wanted.
class KERNEL_API VoidClass
{
public:
    virtual ~VoidClass();
};

/// Owning pointer: a copy retains, destruction and reassignment release. May be null. One variable is not safe for
/// concurrent writes; the object's count is.
template <class T>
class Counted
{
public:
    using element_type = T;

    Counted() = default;
    Counted(std::nullptr_t) {}
    Counted(T* p) : m_p(p)
    {
        if (m_p) m_p->Retain();
    }
    Counted(Counted const& o) : Counted(o.m_p) {}
    Counted(Counted&& o) noexcept : m_p(std::exchange(o.m_p, nullptr)) {}
    template <class U>
    requires std::is_convertible_v<U*, T*> Counted(Counted<U> const& o) : Counted(static_cast<T*>(o.Get())) {}
    template <class U>
    requires std::is_convertible_v<U*, T*> Counted(Counted<U>&& o)
    noexcept : m_p(o.Detach()) {}
    ~Counted()
    {
        if (m_p) m_p->Release();
    }

    /// Takes the new object before it lets go of the old one, so that self-assignment is safe.
    Counted& operator=(Counted o) noexcept
    {
        std::swap(m_p, o.m_p);
        return *this;
    }

    T* Get() const { return m_p; }
    T* operator->() const { return m_p; }
    T& operator*() const { return *m_p; }
    explicit operator bool() const { return m_p != nullptr; }
    void Reset() { *this = nullptr; }

    /// Gives up the pointer without releasing: the caller now owns the reference.
    [[nodiscard]] T* Detach() noexcept { return std::exchange(m_p, nullptr); }

    friend bool operator==(Counted const& a, Counted const& b) { return a.m_p == b.m_p; }
    friend bool operator==(Counted const& a, std::nullptr_t) { return !a.m_p; }
    friend bool operator<(Counted const& a, Counted const& b) { return std::less<T*>()(a.m_p, b.m_p); }

private:
    T* m_p = nullptr;
};

template <class T, class U>
bool operator==(Counted<T> const& a, U* b)
{
    return a.Get() == b;
}

/// Makes an object and the first reference to it.
template <class T, class... Args>
Counted<T> MakeCounted(Args&&... args)
{
    return Counted<T>(new T(std::forward<Args>(args)...));
}

/// A reference to @p p, or null if it is null or at count 0; see Countable::RetainIfAlive for when that may be asked.
template <class T>
Counted<T> CountedIfAlive(T* p)
{
    if (!p || !p->RetainIfAlive()) return nullptr;
    Counted<T> result(p);
    p->Release();
    return result;
}

/// The object as a @p T, or null if it is not one.
template <class T, class U>
Counted<T> CountedCast(Counted<U> const& p)
{
    return Counted<T>(dynamic_cast<T*>(p.Get()));
}

/// A pointer in a signature that takes no reference: the callee keeps nothing beyond the call. May be null.
template <class T>
class NonCounted
{
public:
    NonCounted() = default;
    NonCounted(std::nullptr_t) {}
    NonCounted(T* p) : m_p(p) {}
    template <class U>
    requires std::is_convertible_v<U*, T*> NonCounted(NonCounted<U> const& o) : m_p(o.Get()) {}
    template <class U>
    requires std::is_convertible_v<U*, T*> NonCounted(Counted<U> const& o) : m_p(o.Get()) {}

    T* Get() const { return m_p; }
    T* operator->() const { return m_p; }
    T& operator*() const { return *m_p; }
    explicit operator bool() const { return m_p != nullptr; }
    friend bool operator==(NonCounted const& a, NonCounted const& b) { return a.m_p == b.m_p; }
    friend bool operator<(NonCounted const& a, NonCounted const& b) { return std::less<T*>()(a.m_p, b.m_p); }

private:
    T* m_p = nullptr;
};

/// Owning pointer to an item that a file store keeps under its own control. A type of its own, so that such a pointer
/// is never stored away by accident: GetCounted takes it out of jail on purpose.
template <class T>
class JailCounted
{
public:
    JailCounted() = default;
    JailCounted(std::nullptr_t) {}
    explicit JailCounted(Counted<T> p) : m_p(std::move(p)) {}

    T* Get() const { return m_p.Get(); }
    T* operator->() const { return m_p.Get(); }
    T& operator*() const { return *m_p; }
    explicit operator bool() const { return static_cast<bool>(m_p); }
    Counted<T> const& GetCounted() const { return m_p; }
    void Reset() { m_p.Reset(); }

private:
    Counted<T> m_p;
};

/// Owning pointer to the one canonical copy of a shared object: two of the same class are equal exactly when the
/// pointers are. Only the consolidating operations make one from a plain pointer.
template <class T>
class Consolidated
{
public:
    Consolidated() = default;
    Consolidated(std::nullptr_t) {}
    template <class U>
    requires std::is_convertible_v<U*, T*> Consolidated(Consolidated<U> const& o) : m_p(o.GetCounted()) {}
    /// The caller vouches that @p p is the canonical copy.
    static Consolidated Trust(Counted<T> p)
    {
        Consolidated result;
        result.m_p = std::move(p);
        return result;
    }

    T* Get() const { return m_p.Get(); }
    T* operator->() const { return m_p.Get(); }
    T& operator*() const { return *m_p; }
    explicit operator bool() const { return static_cast<bool>(m_p); }
    Counted<T> const& GetCounted() const { return m_p; }
    friend bool operator==(Consolidated const& a, Consolidated const& b) { return a.m_p == b.m_p; }
    friend bool operator<(Consolidated const& a, Consolidated const& b) { return a.m_p < b.m_p; }

private:
    Counted<T> m_p;
};

} // namespace Kernel

template <class T>
struct std::hash<Kernel::Counted<T>>
{
    size_t operator()(Kernel::Counted<T> const& p) const { return std::hash<T*>()(p.Get()); }
};
