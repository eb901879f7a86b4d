#include "libkernel/serialisation/Defaults.h"

#include "libkernel/core/ConvertEnc.h"

#include <algorithm>
#include <cstring>

namespace Kernel::Defaults {

namespace {

std::vector<u8> CopyBytes(void const* bytes, u64 size)
{
    u8 const* const from = static_cast<u8 const*>(bytes);
    return {from, from + size};
}

bool SameBytes(std::vector<u8> const& kept, void const* bytes, u64 size)
{
    return kept.size() == size && (size == 0 || std::memcmp(kept.data(), bytes, size) == 0);
}

template <class Values>
std::vector<u8> PackBits(Values const& values, u64 count)
{
    std::vector<u8> packed((count + 7) / 8);
    for (u64 i = 0; i < count; ++i)
        if (values[i]) packed[i / 8] |= static_cast<u8>(1u << (i % 8));
    return packed;
}

template <class Values>
bool SameBits(DefaultTypeArray const& kept, Values const& values, u64 count)
{
    if (kept.GetPropType() != PropType::Bool || kept.GetCount() != count) return false;
    for (u64 i = 0; i < count; ++i)
        if (static_cast<bool>(kept.GetBytes()[i / 8] >> (i % 8) & 1) != static_cast<bool>(values[i])) return false;
    return true;
}

template <class Enc>
std::vector<String8> ConvertTexts(StringT<Enc> const* texts, u64 count)
{
    std::vector<String8> result;
    result.reserve(count);
    for (u64 i = 0; i < count; ++i) result.push_back(ConvertedTo<TEncUtf8>(texts[i]));
    return result;
}

} // namespace

DefaultBase::~DefaultBase() = default;
DefaultType::~DefaultType() = default;
DefaultTypeArray::~DefaultTypeArray() = default;
DefaultString::~DefaultString() = default;
DefaultStringArray::~DefaultStringArray() = default;
DefaultCustom::~DefaultCustom() = default;
DefaultCustomArray::~DefaultCustomArray() = default;
DefaultEnum::~DefaultEnum() = default;
DefaultEnumArray::~DefaultEnumArray() = default;
DefaultFlagSet::~DefaultFlagSet() = default;
DefaultSharedObject::~DefaultSharedObject() = default;
DefaultSharedObjectArray::~DefaultSharedObjectArray() = default;

DefaultType::DefaultType(IDTag tag, PropType type, void const* value, u64 size)
    : DefaultOf(tag), m_type(type), m_bytes(CopyBytes(value, size))
{
}

bool DefaultType::Compare(PropType type, void const* value, u64 size) const
{
    return type == m_type && SameBytes(m_bytes, value, size);
}

DefaultTypeArray::DefaultTypeArray(IDTag tag, PropType type, void const* values, u64 unitSize, u64 count)
    : DefaultOf(tag), m_type(type), m_unitSize(unitSize), m_count(count), m_bytes(CopyBytes(values, unitSize * count))
{
}

DefaultTypeArray::DefaultTypeArray(IDTag tag, bool const* values, u64 count)
    : DefaultOf(tag), m_type(PropType::Bool), m_unitSize(1), m_count(count), m_bytes(PackBits(values, count))
{
}

DefaultTypeArray::DefaultTypeArray(IDTag tag, std::vector<bool> const& values)
    : DefaultOf(tag), m_type(PropType::Bool), m_unitSize(1), m_count(values.size()),
      m_bytes(PackBits(values, values.size()))
{
}

bool DefaultTypeArray::Compare(PropType type, void const* values, u64 unitSize, u64 count) const
{
    return type == m_type && type != PropType::Bool && unitSize == m_unitSize && count == m_count &&
           SameBytes(m_bytes, values, m_bytes.size());
}

bool DefaultTypeArray::Compare(bool const* values, u64 count) const
{
    return SameBits(*this, values, count);
}

bool DefaultTypeArray::Compare(std::vector<bool> const& values) const
{
    return SameBits(*this, values, values.size());
}

DefaultString::DefaultString(IDTag tag, String8 const& text) : DefaultOf(tag), m_text(text) {}
DefaultString::DefaultString(IDTag tag, String16 const& text) : DefaultOf(tag), m_text(ConvertedTo<TEncUtf8>(text)) {}
DefaultString::DefaultString(IDTag tag, String32 const& text) : DefaultOf(tag), m_text(ConvertedTo<TEncUtf8>(text)) {}

DefaultStringArray::DefaultStringArray(IDTag tag, String8 const* texts, u64 count)
    : DefaultOf(tag), m_texts(texts, texts + count)
{
}

DefaultStringArray::DefaultStringArray(IDTag tag, String16 const* texts, u64 count)
    : DefaultOf(tag), m_texts(ConvertTexts(texts, count))
{
}

DefaultStringArray::DefaultStringArray(IDTag tag, String32 const* texts, u64 count)
    : DefaultOf(tag), m_texts(ConvertTexts(texts, count))
{
}

bool DefaultStringArray::Compare(String8 const* texts, u64 count) const
{
    return std::equal(m_texts.begin(), m_texts.end(), texts, texts + count);
}

DefaultCustom::DefaultCustom(IDTag tag, void const* value, u64 size) : DefaultOf(tag), m_bytes(CopyBytes(value, size))
{
}

bool DefaultCustom::Compare(void const* value, u64 size) const
{
    return SameBytes(m_bytes, value, size);
}

DefaultCustomArray::DefaultCustomArray(IDTag tag, void const* values, u64 unitSize, u64 count)
    : DefaultOf(tag), m_unitSize(unitSize), m_count(count), m_bytes(CopyBytes(values, unitSize * count))
{
}

bool DefaultCustomArray::Compare(void const* values, u64 unitSize, u64 count) const
{
    return unitSize == m_unitSize && count == m_count && SameBytes(m_bytes, values, m_bytes.size());
}

DefaultEnum::DefaultEnum(IDTag tag, int value, EnumSerialiser const& serialiser) : DefaultOf(tag)
{
    Init(value, serialiser);
}

void DefaultEnum::Init(int value, EnumSerialiser const& serialiser)
{
    m_value = value;
    if (!serialiser.EncodeToSerial(value, m_code, m_version)) m_code = m_version = 0;
}

DefaultEnumArray::DefaultEnumArray(IDTag tag, int const* values, u64 count, EnumSerialiser const& serialiser)
    : DefaultOf(tag)
{
    Init(values, count, serialiser);
}

void DefaultEnumArray::Init(int const* values, u64 count, EnumSerialiser const& serialiser)
{
    m_values.assign(values, values + count);
    if (serialiser.EncodeToSerial(values, count, m_codes, m_version)) return;
    m_codes.assign(count, 0);
    m_version = 0;
}

bool DefaultEnumArray::Compare(unsigned short const* codes, u64 count, unsigned short version) const
{
    return version == m_version && std::equal(m_codes.begin(), m_codes.end(), codes, codes + count);
}

DefaultFlagSet::DefaultFlagSet(IDTag tag, u64 flags, unsigned char width, FlagSerialiser const& serialiser)
    : DefaultOf(tag)
{
    Init(flags, width, serialiser);
}

void DefaultFlagSet::Init(u64 flags, unsigned char, FlagSerialiser const& serialiser)
{
    m_flags = flags;
    if (!serialiser.EncodeToSerial(flags, m_encoded, m_version)) {
        m_encoded = 0;
        m_version = 0;
    }
    m_activeBytes = FlagSerialiser::GetStoredBytes(m_encoded);
}

DefaultSharedObject::DefaultSharedObject(IDTag tag, Consolidated<SharedSerialisable> object)
    : DefaultOf(tag), m_object(std::move(object))
{
}

DefaultSharedObjectArray::DefaultSharedObjectArray(IDTag tag, Objects objects)
    : DefaultOf(tag), m_objects(std::move(objects))
{
}

Item Bool(IDTag tag, bool value)
{
    u8 const byte = value ? 1 : 0;
    return MakeCounted<DefaultType>(tag, PropType::Bool, &byte, u64{1});
}

Item Text(IDTag tag, String8 const& text)
{
    return MakeCounted<DefaultString>(tag, text);
}

Item Bools(IDTag tag, std::vector<bool> const& values)
{
    return MakeCounted<DefaultTypeArray>(tag, values);
}

Item Texts(IDTag tag, std::vector<String8> const& texts)
{
    return MakeCounted<DefaultStringArray>(tag, texts.data(), u64{texts.size()});
}

Item Objects(IDTag tag, std::vector<Consolidated<SharedSerialisable>> objects)
{
    return MakeCounted<DefaultSharedObjectArray>(tag, std::move(objects));
}

} // namespace Kernel::Defaults
