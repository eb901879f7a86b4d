#pragma once

#include "libkernel/core/FragmentedRawData.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/InSerialiserProperty.h"

#include <array>
#include <vector>

namespace Kernel {

// What properties point to in the pools of a parse, and how lists of them are arranged and searched.

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

/// Bytes of a scalar that lies in the property itself, by type byte: values of up to 8 bytes, and enums as code and
/// version. 0 for all others.
constexpr std::array<u8, 256> MakeInlineSizes()
{
    std::array<u8, 256> sizes{};
    for (u32 type = 1; type < c_propTypeCount; ++type)
        if (c_propSizes[type] <= 8) sizes[type] = c_propSizes[type];
    sizes[static_cast<u8>(PropType::Enum)] = 4;
    return sizes;
}
inline constexpr std::array<u8, 256> c_inlineSizes = MakeInlineSizes();

/// A list up to this size keeps the order of its file: whoever saves a class's properties in one order mostly asks for
/// them in the same, so the next one asked for is the next in line. Longer lists are sorted.
constexpr u32 c_unsortedList = 16;

/// One of 64 bits for a tag. A list keeps the bits of its tags, so that most questions for a tag that it lacks, which
/// are as many as it has defaults, end at once.
inline u64 GetTagBit(IDTag tag)
{
    return u64(1) << (tag.value * 0x9E3779B9u >> 26);
}

/// What is noted of a list while it is being read: the bits of its tags, whether one of them may have come twice, and
/// whether a property holds something.
struct TagBits
{
    u64 bits = 0;
    bool mayRepeat = false;
    bool holdsSomething = false;

    void Add(IDTag tag)
    {
        u64 const bit = GetTagBit(tag);
        mayRepeat |= (bits & bit) != 0;
        bits |= bit;
    }
};

/// Puts a parsed list of @p count properties into the order in which it is searched, and drops all but the last of each
/// tag. Gives the count that remains.
u32 ArrangeProperties(InSerialiserProperty* properties, u32 count, TagBits const& tags);

/// Finds a tag in sorted properties, or null.
InSerialiserProperty* FindSorted(InSerialiserProperty* properties, u32 count, IDTag tag);

} // namespace Kernel
