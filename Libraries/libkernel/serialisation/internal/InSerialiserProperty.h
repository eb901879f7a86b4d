#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/FragmentedRawData.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/RawData.h"
#include "libkernel/core/String.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/PropType.h"

#include <string_view>
#include <vector>

namespace Kernel {

/// A typed value of variable size in a pool. The payload follows, aligned to 8.
struct StoredValue
{
    u32 count; // Elements of an array or strings; bytes of a string or custom block; bytes of flags.
    u32 extra; // Element size of custom blocks; version of enums and flags; total bytes of strings.

    u8 const* GetPayload() const { return reinterpret_cast<u8 const*>(this + 1); }
    u8* GetPayload() { return reinterpret_cast<u8*>(this + 1); }
};
static_assert(sizeof(StoredValue) == 8);

/// Fragmented data shorter than a block of it stays in the pool until somebody asks, since each block is 16 KiB.
struct StoredFragments
{
    Counted<FragmentedRawData> data; // Null: the bytes below.
    u8 const* bytes = nullptr;
    u64 size = 0;
    u64 blockSize = 0;
};

struct StoredDataStream
{
    u8 const* items;
    u64 size; // Without the closing byte.
    u16 version;
};

/// Objects of an array; pointers to them follow, which own a reference each and may be null.
struct StoredObjects
{
    u64 count;

    /// @p T is Serialisable or SharedSerialisable, whichever they are.
    template <class T>
    T** GetObjects()
    {
        return reinterpret_cast<T**>(this + 1);
    }
};

struct StoredClass
{
    ClassUID uid;
    u16 version = 0;
    Counted<InSerialiser const> list;
};

struct StoredClasses
{
    ClassUID uid;
    u16 version = 0;
    std::vector<Counted<InSerialiser const>> lists;
};

/// One property of a parsed list, or one element of an array that is being read. Small enough that a list is an array
/// of them. Moves as bytes; whoever holds the last copy calls Release.
struct InSerialiserProperty
{
    using Type = InSerialiser::PropertyType;

    IDTag tag;
    Type kind = Type::None;
    u8 typeByte = 0; // As in the file, with the array bit.
    // The text lies in a string of its own, which those who ask share: long texts, and the defaults of a class.
    bool isOwnString = false;
    union
    {
        u64 number = 0;  // Kind Value with GetInlineSize; elements of a NullArray.
        u8 const* bytes; // Kind Value: fixed sizes above 8, in the pool.
        StoredValue const* value;
        String8* string;
        RawDataBlock* rawData;
        StoredFragments* fragments;
        StoredDataStream const* dataStream;
        Serialisable* object; // Owns a reference, as do the next two. Null for kind NullObject.
        SharedSerialisable* shared;
        DelayLoadHolder* holder; // May be null.
        StoredObjects* objects;
        StoredClass* inlineClass;
        StoredClasses* classes;
    };

    PropType GetType() const { return static_cast<PropType>(typeByte & ~c_propArrayBit); }
    bool IsArray() const { return (typeByte & c_propArrayBit) != 0; }
    /// Bytes of a scalar that lies in the property itself: values of up to 8 bytes, and enums as code and version. 0
    /// for all others.
    static u32 GetInlineSize(u8 typeByte)
    {
        if (typeByte & c_propArrayBit) return 0;
        u32 const size = c_propSizes[typeByte];
        return size > 8 ? 0 : typeByte == static_cast<u8>(PropType::Enum) ? 4 : size;
    }
    /// The text of a string or string-shaped scalar.
    std::string_view GetText() const;
    /// Elements of an array of typed values.
    u64 GetArrayCount() const { return value->count; }

    /// Takes over the object; false, with nothing changed, if it is null.
    bool SetObject(Counted<Serialisable> taken);
    void SetShared(Counted<SharedSerialisable> taken);
    /// For an object of either kind: one more owner.
    void Retain() const;
    /// False where Release would have nothing to do.
    bool HoldsSomething() const
    {
        return kind == Type::Value ? isOwnString : kind != Type::NullObject && kind != Type::NullArray;
    }
    /// Lets go of what the property holds, and makes it None.
    void Release();
};
static_assert(sizeof(InSerialiserProperty) == 16 && std::is_trivially_copyable_v<InSerialiserProperty>);

/// A list up to this size keeps the order of its file: whoever saves a class's properties in one order mostly asks for
/// them in the same, so the next one asked for is the next in line. Longer lists are sorted.
constexpr u32 c_unsortedList = 16;

/// One of 64 bits for a tag. A list keeps the bits of its tags, so that most questions for a tag that it lacks, which
/// are as many as it has defaults, end at once.
inline u64 GetTagBit(IDTag tag)
{
    return u64(1) << (tag.value * 0x9E3779B9u >> 26);
}

/// Puts a parsed list of @p count properties into the order in which it is searched, and drops all but the last of each
/// tag. Gives the count that remains, and the bits of the tags.
u32 ArrangeProperties(InSerialiserProperty* properties, u32 count, u64& tagBits);

/// Finds a tag in sorted properties, or null.
InSerialiserProperty* FindSorted(InSerialiserProperty* properties, u32 count, IDTag tag);

} // namespace Kernel
