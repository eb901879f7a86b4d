#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Types.h"

#include <atomic>

namespace Kernel {

class CompareContext;
class FileStore;
class HashAccumulator;
class InSerialiser;
class OutSerialiser;
class SharedClassProperties;

/// Base of value-like objects of which one copy of each distinct value is meant to exist. The canonical copy is found
/// or made by SharedClassProperties::ConsolidateObjectSacrifice, and is not changed afterwards, so it may be read from
/// any thread.
///
/// A class also has `static SharedClassProperties const* GetTypeSharedClassProperties()`, its own description.
class KERNEL_API SharedSerialisable : public virtual Countable
{
public:
    virtual void Save(OutSerialiser& out) const = 0;
    virtual bool Load(InSerialiser const& in, FileStore& store, unsigned short version) = 0;
    /// Equal objects must feed the same bytes. May run under the class's lock: must not consolidate an object of the
    /// same class. The same holds for CompareMembers and OnConsolidated.
    virtual void AccumulateHash(HashAccumulator& hash) const = 0;
    virtual SharedClassProperties const* GetObjectClassProperties() const = 0;
    virtual bool CompareMembers(SharedSerialisable const& other, CompareContext const& context) const = 0;
    /// The object has just become the canonical copy. Does nothing unless overridden.
    virtual void OnConsolidated() const;

    /// True once this is the canonical copy of its value.
    bool IsConsolidated() const { return m_isConsolidated.load(std::memory_order_acquire); }
    /// AccumulateHash from a fresh accumulator.
    unsigned int GenerateHash() const;

    /// By the rules of Serialisable::Equals.
    bool Equals(Consolidated<SharedSerialisable> const& other) const;
    bool Equals(Consolidated<SharedSerialisable> const& other, CompareContext const& context) const;
    bool Equals(Counted<SharedSerialisable const> const& other) const;
    bool Equals(Counted<SharedSerialisable const> const& other, CompareContext const& context) const;

protected:
    SharedSerialisable() = default;
    /// A copy is a value of its own: it is not canonical.
    SharedSerialisable(SharedSerialisable const& other);
    SharedSerialisable& operator=(SharedSerialisable const&) { return *this; }
    ~SharedSerialisable() override;

private:
    friend class SharedClassProperties;
    bool EqualsI(SharedSerialisable const* other, CompareContext const& context) const;

    mutable std::atomic<bool> m_isConsolidated{false};
};

} // namespace Kernel
