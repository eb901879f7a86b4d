#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/RawData.h"
#include "libkernel/core/String.h"
#include "libkernel/serialisation/PropType.h"

#include <string_view>
#include <type_traits>

namespace Kernel {

class DelayLoadHolder;
class Serialisable;
class SharedSerialisable;
struct StoredClass;
struct StoredClasses;
struct StoredDataStream;
struct StoredFragments;
struct StoredObjects;
struct StoredValue;

/// What stands under a tag of a parsed list: InSerialiser::PropertyType.
enum class InSerialiserPropertyType : u8
{
    None = 0,  ///< Nothing.
    Value = 1, ///< A typed value: numbers, bool, enum, strings, custom blocks, tags, raw structs, flag sets.
    RawData = 2,
    FragmentedRawData = 3,
    DataStream = 4,
    Object = 5,
    ObjectArray = 6,
    SharedObject = 7,
    SharedObjectArray = 8,
    NullObject = 9,
    NullArray = 10, ///< An array of nothing but nulls, which answers as plain or shared.
    Class = 11,
    ClassArray = 12,
    DelayLoad = 13
};

/// How a list keeps one property, for the inline operations of InSerialiser; its callers have no use for it.
///
/// Also one element of an array that is being read. Small enough that a list is an array of them. Moves as bytes;
/// whoever holds the last copy calls Release.
struct InSerialiserProperty
{
    using Type = InSerialiserPropertyType;

    IDTag tag;
    Type kind = Type::None;
    u8 typeByte = 0; // As in the file, with the array bit.
    // The text lies in a string of its own, which those who ask share: long texts, and the defaults of a class.
    bool isOwnString = false;
    // The property owns a reference to each of its objects. During a parse the parse does.
    bool ownsObjects = false;
    union
    {
        u64 number = 0;  // Kind Value with GetInlineSize; elements of a NullArray.
        u8 const* bytes; // Kind Value: fixed sizes above 8, in the pool.
        StoredValue const* value;
        String8* string;
        RawDataBlock* rawData;
        StoredFragments* fragments;
        StoredDataStream const* dataStream;
        Serialisable* object; // Null for kind NullObject.
        SharedSerialisable* shared;
        DelayLoadHolder* holder; // Owns a reference; may be null.
        StoredObjects* objects;
        StoredClass* inlineClass;
        StoredClasses* classes;
    };

    PropType GetType() const { return static_cast<PropType>(typeByte & ~c_propArrayBit); }
    bool IsArray() const { return (typeByte & c_propArrayBit) != 0; }
    /// True for a scalar of that type, of at most 8 bytes: its bytes are those of number.
    bool IsNumber(PropType type) const { return kind == Type::Value && typeByte == static_cast<u8>(type); }
    /// The text of a string or string-shaped scalar.
    std::string_view GetText() const;

    /// For an object or an array of them, and those in inline classes: takes a reference to each. For what outlives the
    /// parse.
    void OwnObjects();
    /// False where Release would have nothing to do.
    bool HoldsSomething() const;
    /// Lets go of what the property holds, and makes it None.
    void Release();
};
static_assert(sizeof(InSerialiserProperty) == 16 && std::is_trivially_copyable_v<InSerialiserProperty>);

} // namespace Kernel
