#include "libkernel/serialisation/Serialisable.h"

#include "libkernel/serialisation/CompareContext.h"

namespace Kernel {

Serialisable::~Serialisable() = default;

void Serialisable::AccumulateHash(HashAccumulator&) const {}

bool Serialisable::CompareMembers(Serialisable const&, CompareContext const&) const
{
    return false;
}

bool Serialisable::Equals(NonCounted<Serialisable const> other) const
{
    return Equals(this, other);
}

bool Serialisable::Equals(NonCounted<Serialisable const> other, CompareContext const& context) const
{
    return Equals(this, other, context);
}

bool Serialisable::Equals(NonCounted<Serialisable const> a, NonCounted<Serialisable const> b)
{
    return Equals(a, b, CompareContext());
}

bool Serialisable::Equals(NonCounted<Serialisable const> a, NonCounted<Serialisable const> b,
                          CompareContext const& context)
{
    if (a == b) return true;
    if (!a || !b || a->GetObjectClassProperties() != b->GetObjectClassProperties()) return false;
    return a->CompareMembers(*b, context);
}

} // namespace Kernel
