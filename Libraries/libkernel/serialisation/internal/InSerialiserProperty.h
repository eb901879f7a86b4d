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

/// Objects of an array; they follow, Counted or Consolidated.
struct StoredObjects
{
    u64 count;

    template <class P>
    P* GetObjects()
    {
        return reinterpret_cast<P*>(this + 1);
    }
};
static_assert(sizeof(Counted<Serialisable>) == sizeof(void*));
static_assert(sizeof(Consolidated<SharedSerialisable>) == sizeof(void*));

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

    /// False where Release would have nothing to do.
    bool HoldsSomething() const
    {
        return kind == Type::Value ? isOwnString : kind != Type::NullObject && kind != Type::NullArray;
    }
    /// Lets go of what the property holds, and makes it None.
    void Release();
};
static_assert(sizeof(InSerialiserProperty) == 16 && std::is_trivially_copyable_v<InSerialiserProperty>);

/// Sorts @p count properties by tag and drops all but the last of each tag. Gives the count that remains.
u32 SortProperties(InSerialiserProperty* properties, u32 count);

/// Finds a tag among sorted properties, or null.
inline InSerialiserProperty* FindProperty(InSerialiserProperty* properties, u32 count, IDTag tag)
{
    // Object lists are short: a walk is cheaper than the branches of a search.
    constexpr u32 c_walked = 16;
    InSerialiserProperty* at = properties;
    while (count > c_walked) {
        u32 const half = count / 2;
        if (at[half].tag <= tag) {
            at += half;
            count -= half;
        } else
            count = half;
    }
    for (InSerialiserProperty* const end = at + count; at != end; ++at) {
        if (at->tag == tag) return at;
    }
    return nullptr;
}

} // namespace Kernel
