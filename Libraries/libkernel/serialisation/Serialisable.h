#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Types.h"

namespace Kernel {

class ClassProperties;
class CompareContext;
class FileStore;
class HashAccumulator;
class InSerialiser;
class OutSerialiser;

/// Base of objects with identity that can be saved in a property stream: an object met twice in one save is written
/// once, and loads as one object.
class KERNEL_API Serialisable : public virtual Countable
{
public:
    /// Writes the object's properties. A derived class calls its base's Save on the same serialiser: an object has one
    /// flat list. What @p out throws passes through.
    virtual void Save(OutSerialiser& out) const = 0;
    /// Reads them, as if every one were present. @p version is the class's schema version in the file. False refuses
    /// the object, which ends the whole parse. Nothing that @p in gives may be kept by pointer.
    virtual bool Load(InSerialiser const& in, FileStore& store, unsigned short version) = 0;
    /// Feeds what CompareMembers compares. Does nothing unless overridden.
    virtual void AccumulateHash(HashAccumulator& hash) const;
    /// The description of the object's most derived class; never null in a class that can be saved.
    virtual ClassProperties const* GetObjectClassProperties() const = 0;
    /// Compares with @p other, which has the same description. False unless overridden.
    virtual bool CompareMembers(Serialisable const& other, CompareContext const& context) const;

    /// Identical objects are equal; a null is not, nor are objects of different descriptions; otherwise CompareMembers
    /// decides. Two nulls are identical.
    bool Equals(NonCounted<Serialisable const> other) const;
    bool Equals(NonCounted<Serialisable const> other, CompareContext const& context) const;
    static bool Equals(NonCounted<Serialisable const> a, NonCounted<Serialisable const> b);
    static bool Equals(NonCounted<Serialisable const> a, NonCounted<Serialisable const> b,
                       CompareContext const& context);

protected:
    ~Serialisable() override;
};

} // namespace Kernel
