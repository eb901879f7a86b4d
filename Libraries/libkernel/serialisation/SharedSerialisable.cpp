#include "libkernel/serialisation/SharedSerialisable.h"

#include "libkernel/core/Hash.h"
#include "libkernel/serialisation/CompareContext.h"

namespace Kernel {

SharedSerialisable::SharedSerialisable(SharedSerialisable const& other) : Countable(other) {}
SharedSerialisable::~SharedSerialisable() = default;

void SharedSerialisable::OnConsolidated() const {}

unsigned int SharedSerialisable::GenerateHash() const
{
    HashAccumulator hash;
    AccumulateHash(hash);
    return hash.GetHash();
}

bool SharedSerialisable::Equals(Consolidated<SharedSerialisable> const& other) const
{
    return EqualsI(other.Get(), CompareContext());
}

bool SharedSerialisable::Equals(Consolidated<SharedSerialisable> const& other, CompareContext const& context) const
{
    return EqualsI(other.Get(), context);
}

bool SharedSerialisable::Equals(Counted<SharedSerialisable const> const& other) const
{
    return EqualsI(other.Get(), CompareContext());
}

bool SharedSerialisable::Equals(Counted<SharedSerialisable const> const& other, CompareContext const& context) const
{
    return EqualsI(other.Get(), context);
}

bool SharedSerialisable::EqualsI(SharedSerialisable const* other, CompareContext const& context) const
{
    if (this == other) return true;
    if (!other || GetObjectClassProperties() != other->GetObjectClassProperties()) return false;
    return CompareMembers(*other, context);
}

} // namespace Kernel
