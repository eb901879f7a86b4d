#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/String.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/FlagSerialiser.h"
#include "libkernel/serialisation/PropType.h"
#include "libkernel/serialisation/SharedSerialisable.h"

#include <type_traits>
#include <vector>

namespace Kernel {

/// The default values of a class's properties. None changes once made, so they may be read from any thread. A value is
/// left out of a file when Compare says that it equals the default; a default of one kind never equals a value of
/// another.
///
/// Make, at the end, and the builders before it give the array that a description takes.
namespace Defaults {

enum class DefaultItemType : u8
{
    Type = 0,
    TypeArray = 1,
    String = 2,
    StringArray = 3, ///< Has no form in a file: a class with one cannot be saved.
    Custom = 4,
    CustomArray = 5,
    Enum = 6,
    EnumArray = 7,
    FlagSet = 8,
    SharedObject = 9,
    SharedObjectArray = 10
};

class KERNEL_API DefaultBase : public Countable
{
public:
    IDTag GetIDTag() const { return m_tag; }
    virtual DefaultItemType GetDefaultType() const = 0;

protected:
    explicit DefaultBase(IDTag tag) : m_tag(tag) {}
    ~DefaultBase() override;

private:
    IDTag const m_tag;
};

/// A default of one kind; what the eleven classes share.
template <DefaultItemType Kind>
class DefaultOf : public DefaultBase
{
public:
    static constexpr DefaultItemType c_kind = Kind;
    DefaultItemType GetDefaultType() const final { return Kind; }

protected:
    using DefaultBase::DefaultBase;
};

class KERNEL_API DefaultType : public DefaultOf<DefaultItemType::Type>
{
public:
    /// Copies @p size bytes at @p value, which lie as they go to the file: little-endian.
    DefaultType(IDTag tag, PropType type, void const* value, u64 size);
    bool Compare(PropType type, void const* value, u64 size) const;
    PropType GetPropType() const { return m_type; }
    std::vector<u8> const& GetBytes() const { return m_bytes; }

protected:
    ~DefaultType() override;

private:
    PropType const m_type;
    std::vector<u8> const m_bytes;
};

class KERNEL_API DefaultTypeArray : public DefaultOf<DefaultItemType::TypeArray>
{
public:
    DefaultTypeArray(IDTag tag, PropType type, void const* values, u64 unitSize, u64 count);
    /// Packs the values to bits.
    DefaultTypeArray(IDTag tag, bool const* values, u64 count);
    DefaultTypeArray(IDTag tag, std::vector<bool> const& values);
    bool Compare(PropType type, void const* values, u64 unitSize, u64 count) const;
    bool Compare(bool const* values, u64 count) const;
    bool Compare(std::vector<bool> const& values) const;
    PropType GetPropType() const { return m_type; }
    u64 GetUnitSize() const { return m_unitSize; }
    u64 GetCount() const { return m_count; }
    /// The values one behind the other; eight to a byte for bool.
    std::vector<u8> const& GetBytes() const { return m_bytes; }

protected:
    ~DefaultTypeArray() override;

private:
    PropType const m_type;
    u64 const m_unitSize;
    u64 const m_count;
    std::vector<u8> const m_bytes;
};

class KERNEL_API DefaultString : public DefaultOf<DefaultItemType::String>
{
public:
    DefaultString(IDTag tag, String8 const& text);
    DefaultString(IDTag tag, String16 const& text);
    DefaultString(IDTag tag, String32 const& text);
    bool Compare(String8 const& text) const { return text == m_text; }
    String8 const& GetText() const { return m_text; }

protected:
    ~DefaultString() override;

private:
    String8 const m_text;
};

class KERNEL_API DefaultStringArray : public DefaultOf<DefaultItemType::StringArray>
{
public:
    DefaultStringArray(IDTag tag, String8 const* texts, u64 count);
    DefaultStringArray(IDTag tag, String16 const* texts, u64 count);
    DefaultStringArray(IDTag tag, String32 const* texts, u64 count);
    bool Compare(String8 const* texts, u64 count) const;
    std::vector<String8> const& GetTexts() const { return m_texts; }

protected:
    ~DefaultStringArray() override;

private:
    std::vector<String8> const m_texts;
};

class KERNEL_API DefaultCustom : public DefaultOf<DefaultItemType::Custom>
{
public:
    DefaultCustom(IDTag tag, void const* value, u64 size);
    bool Compare(void const* value, u64 size) const;
    std::vector<u8> const& GetBytes() const { return m_bytes; }

protected:
    ~DefaultCustom() override;

private:
    std::vector<u8> const m_bytes;
};

class KERNEL_API DefaultCustomArray : public DefaultOf<DefaultItemType::CustomArray>
{
public:
    DefaultCustomArray(IDTag tag, void const* values, u64 unitSize, u64 count);
    bool Compare(void const* values, u64 unitSize, u64 count) const;
    u64 GetUnitSize() const { return m_unitSize; }
    u64 GetCount() const { return m_count; }
    std::vector<u8> const& GetBytes() const { return m_bytes; }

protected:
    ~DefaultCustomArray() override;

private:
    u64 const m_unitSize;
    u64 const m_count;
    std::vector<u8> const m_bytes;
};

class KERNEL_API DefaultEnum : public DefaultOf<DefaultItemType::Enum>
{
public:
    /// A value that @p serialiser does not know leaves code and version 0.
    DefaultEnum(IDTag tag, int value, EnumSerialiser const& serialiser);
    bool Compare(unsigned short code, unsigned short version) const { return code == m_code && version == m_version; }
    int GetValue() const { return m_value; }
    unsigned short GetCode() const { return m_code; }
    unsigned short GetVersion() const { return m_version; }

protected:
    ~DefaultEnum() override;

private:
    void Init(int value, EnumSerialiser const& serialiser);

    int m_value = 0;
    unsigned short m_code = 0;
    unsigned short m_version = 0;
};

class KERNEL_API DefaultEnumArray : public DefaultOf<DefaultItemType::EnumArray>
{
public:
    /// Values that no set of @p serialiser knows together leave the version and every code 0.
    DefaultEnumArray(IDTag tag, int const* values, u64 count, EnumSerialiser const& serialiser);
    bool Compare(unsigned short const* codes, u64 count, unsigned short version) const;
    std::vector<int> const& GetValues() const { return m_values; }
    std::vector<unsigned short> const& GetCodes() const { return m_codes; }
    unsigned short GetVersion() const { return m_version; }

protected:
    ~DefaultEnumArray() override;

private:
    void Init(int const* values, u64 count, EnumSerialiser const& serialiser);

    std::vector<int> m_values;
    std::vector<unsigned short> m_codes;
    unsigned short m_version = 0;
};

class KERNEL_API DefaultFlagSet : public DefaultOf<DefaultItemType::FlagSet>
{
public:
    /// @p width is the size of the flag word in bytes. Flags with no encoding leave everything stored 0.
    DefaultFlagSet(IDTag tag, u64 flags, unsigned char width, FlagSerialiser const& serialiser);
    bool Compare(u64 encoded, unsigned short version) const { return encoded == m_encoded && version == m_version; }
    u64 GetFlags() const { return m_flags; }
    u64 GetEncoded() const { return m_encoded; }
    /// Bytes of the encoded value that a file holds.
    unsigned char GetActiveBytes() const { return m_activeBytes; }
    unsigned short GetVersion() const { return m_version; }

protected:
    ~DefaultFlagSet() override;

private:
    void Init(u64 flags, unsigned char width, FlagSerialiser const& serialiser);

    u64 m_flags = 0;
    u64 m_encoded = 0;
    unsigned char m_activeBytes = 0;
    unsigned short m_version = 0;
};

class KERNEL_API DefaultSharedObject : public DefaultOf<DefaultItemType::SharedObject>
{
public:
    DefaultSharedObject(IDTag tag, Consolidated<SharedSerialisable> object);
    bool Compare(Consolidated<SharedSerialisable> const& object) const { return object == m_object; }
    Consolidated<SharedSerialisable> const& GetObject() const { return m_object; }

protected:
    ~DefaultSharedObject() override;

private:
    Consolidated<SharedSerialisable> const m_object;
};

class KERNEL_API DefaultSharedObjectArray : public DefaultOf<DefaultItemType::SharedObjectArray>
{
public:
    using Objects = std::vector<Consolidated<SharedSerialisable>>;
    DefaultSharedObjectArray(IDTag tag, Objects objects);
    bool Compare(Objects const& objects) const { return objects == m_objects; }
    Objects const& GetObjects() const { return m_objects; }

protected:
    ~DefaultSharedObjectArray() override;

private:
    Objects const m_objects;
};

/// One default, as a builder gives it.
using Item = Counted<DefaultBase const>;

/// A number, a tag or a class code.
template <PropValue T>
Item Value(IDTag tag, T value)
{
    return MakeCounted<DefaultType>(tag, PropTypeOf<T>(), &value, sizeof(T));
}
KERNEL_API Item Bool(IDTag tag, bool value);
KERNEL_API Item Text(IDTag tag, String8 const& text);
/// A struct saved with SavePropertyStruct; its bytes as they lie.
template <class T>
requires std::is_trivially_copyable_v<T> Item Custom(IDTag tag, T const& value)
{
    return MakeCounted<DefaultCustom>(tag, &value, sizeof(T));
}
template <class E>
Item EnumValue(IDTag tag, E value, EnumSerialiser const& serialiser)
{
    return MakeCounted<DefaultEnum>(tag, static_cast<int>(value), serialiser);
}
/// An enumeration of bits, or an unsigned number.
template <class F>
Item Flags(IDTag tag, F flags, FlagSerialiser const& serialiser)
{
    using Word =
        std::conditional_t<sizeof(F) == 1, u8,
                           std::conditional_t<sizeof(F) == 2, u16, std::conditional_t<sizeof(F) == 4, u32, u64>>>;
    return MakeCounted<DefaultFlagSet>(tag, static_cast<Word>(flags), static_cast<u8>(sizeof(F)), serialiser);
}
template <class T>
Item Object(IDTag tag, Consolidated<T> const& object)
{
    return MakeCounted<DefaultSharedObject>(tag, object);
}
/// The array forms.
template <PropValue T>
Item Values(IDTag tag, std::vector<T> const& values)
{
    return MakeCounted<DefaultTypeArray>(tag, PropTypeOf<T>(), values.data(), sizeof(T), values.size());
}
KERNEL_API Item Bools(IDTag tag, std::vector<bool> const& values);
KERNEL_API Item Texts(IDTag tag, std::vector<String8> const& texts);
template <class T>
requires std::is_trivially_copyable_v<T> Item Customs(IDTag tag, std::vector<T> const& values)
{
    return MakeCounted<DefaultCustomArray>(tag, values.data(), sizeof(T), values.size());
}
template <class E>
Item EnumValues(IDTag tag, std::vector<E> const& values, EnumSerialiser const& serialiser)
{
    std::vector<int> numbers;
    for (E const value : values) numbers.push_back(static_cast<int>(value));
    return MakeCounted<DefaultEnumArray>(tag, numbers.data(), numbers.size(), serialiser);
}
KERNEL_API Item Objects(IDTag tag, std::vector<Consolidated<SharedSerialisable>> objects);

/// The array that a description takes, with its closing null. Keep it in a function-local static:
///
///     static auto const items = Defaults::Make(Defaults::Value("Widt", 3), Defaults::Bool("Bold", false));
///     return items.data();
template <class... Items>
std::vector<Item> Make(Items... items)
{
    return {std::move(items)..., Item()};
}

} // namespace Defaults
} // namespace Kernel
