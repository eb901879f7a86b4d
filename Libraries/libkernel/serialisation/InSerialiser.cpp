#include "libkernel/serialisation/InSerialiser.h"

#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/Limits.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/FlagSerialiser.h"
#include "libkernel/serialisation/InSerialiserPropertyDataStream.h"
#include "libkernel/serialisation/Serialisable.h"
#include "libkernel/serialisation/SharedSerialisable.h"
#include "libkernel/serialisation/internal/InSerialiserLoader.h"

#include <algorithm>
#include <climits>

namespace Kernel {

namespace {

// JSON deeper than this would overflow the stack of those who walk it.
constexpr u32 c_maxJsonDepth = 1000;

using Property = InSerialiserProperty;
using Type = InSerialiser::PropertyType;

constexpr u8 ScalarByte(PropType type)
{
    return static_cast<u8>(type);
}
constexpr u8 ArrayByte(PropType type)
{
    return static_cast<u8>(static_cast<u8>(type) | c_propArrayBit);
}

template <class Enc>
StringT<Enc> MakeText(std::string_view utf8)
{
    StringT<Enc> text;
    ConvertEnc<Enc, TEncUtf8>(text, utf8.data(), static_cast<int>(utf8.size()));
    return text;
}
template <>
String8 MakeText<TEncUtf8>(std::string_view utf8)
{
    return String8(utf8.data(), static_cast<int>(utf8.size()));
}

bool IsStringSize(std::string_view text)
{
    return text.size() <= INT_MAX / 2;
}

// Reads stored strings one by one; they have been checked.
class TextReader
{
public:
    explicit TextReader(Property const& property) : m_at(property.value->GetPayload()) {}
    std::string_view Next()
    {
        u32 const length = LoadLittleEndian<u32>(m_at);
        std::string_view const text(reinterpret_cast<char const*>(m_at + 4), length);
        m_at += 4 + u64(length);
        return text;
    }

private:
    u8 const* m_at;
};

bool GetBit(u8 const* bits, u64 i)
{
    return (bits[i / 8] >> (i % 8) & 1) != 0;
}

// Whether an array in the file suits one of the caller's, and how much of it to copy.
bool ChooseCount(u64 stored, u64 capacity, u64* storedOut, u64& copied)
{
    if (!storedOut && capacity != stored) return false;
    copied = std::min(stored, capacity);
    return true;
}

} // namespace

InSerialiser::~InSerialiser()
{
    TearDownAllProperties();
}

// For a list that outlives its parse, whose references it had borrowed.
void InSerialiser::OwnObjectsI() const
{
    for (u32 i = 0; i < m_count; ++i) m_properties[i].OwnObjects();
    m_holdsSomething = true;
}

// Finding.

InSerialiserProperty* InSerialiser::FindPropertyI(IDTag tag) const
{
    if (!(m_tagBits & GetTagBit(tag))) return nullptr;
    if (m_count > c_unsortedList) return FindSorted(m_properties, m_count, tag);
    u32 at = m_next;
    for (u32 left = m_count; left > 0; --left) {
        if (at >= m_count) at = 0;
        Property& property = m_properties[at++];
        if (property.tag != tag) continue;
        m_next = at;
        return &property;
    }
    return nullptr;
}

InSerialiserProperty const* InSerialiser::FindPropertyOrDefaultI(IDTag tag) const
{
    if (Property const* const own = FindPropertyI(tag)) return own;
    return m_classInfo ? m_classInfo->FindDefault(tag) : nullptr;
}

InSerialiserProperty const* InSerialiser::FindValueI(IDTag tag, u8 typeByte) const
{
    Property const* const property = FindPropertyOrDefaultI(tag);
    return property && property->kind == Type::Value && property->typeByte == typeByte ? property : nullptr;
}

InSerialiserProperty const* InSerialiser::FindKindI(IDTag tag, PropertyType kind) const
{
    Property const* const property = FindPropertyOrDefaultI(tag);
    return property && property->kind == kind ? property : nullptr;
}

bool InSerialiser::HasProperty(IDTag tag) const
{
    return FindPropertyI(tag) != nullptr;
}

bool InSerialiser::HasPropertyOrDefault(IDTag tag) const
{
    return FindPropertyOrDefaultI(tag) != nullptr;
}

InSerialiser::PropertyType InSerialiser::GetPropertyType(IDTag tag) const
{
    Property const* const property = FindPropertyOrDefaultI(tag);
    return property ? property->kind : Type::None;
}

bool InSerialiser::GetPropertyParams(IDTag tag, PropertyTypeParams& params) const
{
    Property const* const property = FindKindI(tag, Type::Value);
    if (!property) return false;
    params = {property->GetType(), property->IsArray(), property->IsArray() ? property->value->count : 0};
    return true;
}

std::vector<IDTag> InSerialiser::GetTags() const
{
    std::vector<IDTag> tags;
    for (u32 i = 0; i < m_count; ++i) tags.push_back(m_properties[i].tag);
    std::sort(tags.begin(), tags.end());
    return tags;
}

void InSerialiser::TearDown(IDTag tag) const
{
    Property* const found = FindPropertyI(tag);
    if (!found) return;
    Property removed = *found;
    std::copy(found + 1, m_properties + m_count, found);
    --m_count;
    // Whoever owns the place must not find a second copy there.
    m_properties[m_count] = {};
    m_next = 0;
    removed.Release();
}

void InSerialiser::TearDownAllProperties() const
{
    // What is released may look into this list.
    Property* const properties = std::exchange(m_properties, nullptr);
    u32 const count = std::exchange(m_count, 0);
    m_tagBits = 0;
    m_next = 0;
    if (!m_holdsSomething) return;
    for (u32 i = 0; i < count; ++i) {
        if (properties[i].HoldsSomething()) properties[i].Release();
    }
}

// Scalars.

bool InSerialiser::LoadTypeI(IDTag tag, PropType type, void* value, u64 size) const
{
    Property const* const property = FindValueI(tag, ScalarByte(type));
    if (!property || c_propSizes[ScalarByte(type)] != size || size == 0) return false;
    switch (size) {
    // Copies of a known size are one store.
    case 1: std::memcpy(value, &property->number, 1); break;
    case 2: std::memcpy(value, &property->number, 2); break;
    case 4: std::memcpy(value, &property->number, 4); break;
    case 8: std::memcpy(value, &property->number, 8); break;
    default: std::memcpy(value, size < 8 ? reinterpret_cast<u8 const*>(&property->number) : property->bytes, size);
    }
    return true;
}

bool InSerialiser::LoadType(IDTag tag, bool& value) const
{
    Property const* const property = FindValueI(tag, ScalarByte(PropType::Bool));
    if (!property) return false;
    value = property->number != 0;
    return true;
}

bool InSerialiser::LoadType(IDTag tag, String8& text) const
{
    Property const* const property = FindValueI(tag, ScalarByte(PropType::String));
    if (!property) return false;
    if (property->isOwnString) {
        text = *property->string;
        return true;
    }
    std::string_view const view = property->GetText();
    if (!IsStringSize(view)) return false;
    text = MakeText<TEncUtf8>(view);
    return true;
}

template <class Enc>
bool InSerialiser::LoadTextI(IDTag tag, StringT<Enc>& text) const
{
    std::string_view view;
    if (!LoadTextView(tag, view) || !IsStringSize(view)) return false;
    text = MakeText<Enc>(view);
    return true;
}

bool InSerialiser::LoadType(IDTag tag, String16& text) const
{
    return LoadTextI(tag, text);
}

bool InSerialiser::LoadType(IDTag tag, String32& text) const
{
    return LoadTextI(tag, text);
}

bool InSerialiser::LoadTextView(IDTag tag, std::string_view& text) const
{
    Property const* const property = FindValueI(tag, ScalarByte(PropType::String));
    if (!property) return false;
    text = property->GetText();
    return true;
}

bool InSerialiser::IsJsonTextSafe(std::string_view text)
{
    u32 depth = 0;
    bool inString = false;
    for (size_t i = 0; i < text.size(); ++i) {
        char const c = text[i];
        if (inString) {
            if (c == '\\')
                ++i;
            else if (c == '"')
                inString = false;
        } else if (c == '"')
            inString = true;
        else if (c == '/' && (text.substr(i, 2) == "//" || text.substr(i, 2) == "/*")) {
            // What a comment holds must neither count nor open a string.
            std::string_view const ending = text[i + 1] == '/' ? "\n" : "*/";
            size_t const at = text.find(ending, i + 2);
            if (at == text.npos) break;
            i = at + ending.size() - 1;
        } else if (c == '[' || c == '{') {
            if (++depth > c_maxJsonDepth) return false;
        } else if ((c == ']' || c == '}') && depth > 0)
            --depth;
    }
    return true;
}

// Arrays.

void const* InSerialiser::LoadTypeArrayI(IDTag tag, PropType type, u64 unitSize, u64& count) const
{
    if (type == PropType::Bool || c_propSizes[ScalarByte(type)] != unitSize || unitSize == 0) return nullptr;
    Property const* const property = FindValueI(tag, ArrayByte(type));
    if (!property) return nullptr;
    count = property->value->count;
    return property->value->GetPayload();
}

template <class Bools>
bool InSerialiser::LoadBoolsI(IDTag tag, Bools& values) const
{
    Property const* const property = FindValueI(tag, ArrayByte(PropType::Bool));
    if (!property) return false;
    u8 const* const bits = property->value->GetPayload();
    u64 const count = property->value->count;
    values.resize(count);
    for (u64 i = 0; i < count; ++i) values[i] = GetBit(bits, i);
    return true;
}

bool InSerialiser::LoadTypes(IDTag tag, std::vector<bool>& values) const
{
    return LoadBoolsI(tag, values);
}

bool InSerialiser::LoadTypes(IDTag tag, std::deque<bool>& values) const
{
    return LoadBoolsI(tag, values);
}

bool InSerialiser::LoadTypes(IDTag tag, bool* values, u64 capacity, u64* stored) const
{
    Property const* const property = FindValueI(tag, ArrayByte(PropType::Bool));
    u64 copied = 0;
    if (!property || !ChooseCount(property->value->count, capacity, stored, copied)) return false;
    for (u64 i = 0; i < copied; ++i) values[i] = GetBit(property->value->GetPayload(), i);
    if (stored) *stored = property->value->count;
    return true;
}

template <class Enc>
bool InSerialiser::LoadTextsI(IDTag tag, std::vector<StringT<Enc>>& texts) const
{
    Property const* const property = FindValueI(tag, ArrayByte(PropType::String));
    if (!property) return false;
    std::vector<StringT<Enc>> loaded;
    loaded.reserve(property->value->count);
    TextReader reader(*property);
    for (u64 i = 0; i < property->value->count; ++i) {
        std::string_view const text = reader.Next();
        if (!IsStringSize(text)) return false;
        loaded.push_back(MakeText<Enc>(text));
    }
    texts = std::move(loaded);
    return true;
}

template <class Enc>
bool InSerialiser::LoadTextsI(IDTag tag, StringT<Enc>* texts, u64 capacity, u64* stored) const
{
    Property const* const property = FindValueI(tag, ArrayByte(PropType::String));
    u64 copied = 0;
    if (!property || !ChooseCount(property->value->count, capacity, stored, copied)) return false;
    TextReader check(*property);
    for (u64 i = 0; i < copied; ++i) {
        if (!IsStringSize(check.Next())) return false;
    }
    TextReader reader(*property);
    for (u64 i = 0; i < copied; ++i) texts[i] = MakeText<Enc>(reader.Next());
    if (stored) *stored = property->value->count;
    return true;
}

bool InSerialiser::LoadTypes(IDTag tag, std::vector<String8>& texts) const
{
    return LoadTextsI(tag, texts);
}

bool InSerialiser::LoadTypes(IDTag tag, std::vector<String16>& texts) const
{
    return LoadTextsI(tag, texts);
}

bool InSerialiser::LoadTypes(IDTag tag, std::vector<String32>& texts) const
{
    return LoadTextsI(tag, texts);
}

bool InSerialiser::LoadTypes(IDTag tag, String8* texts, u64 capacity, u64* stored) const
{
    return LoadTextsI(tag, texts, capacity, stored);
}

bool InSerialiser::LoadTypes(IDTag tag, String16* texts, u64 capacity, u64* stored) const
{
    return LoadTextsI(tag, texts, capacity, stored);
}

bool InSerialiser::LoadTypes(IDTag tag, String32* texts, u64 capacity, u64* stored) const
{
    return LoadTextsI(tag, texts, capacity, stored);
}

// Structs and blocks of bytes.

bool InSerialiser::LoadTypeCustomI(IDTag tag, void* value, u64 size) const
{
    Property const* const property = FindValueI(tag, ScalarByte(PropType::Custom));
    if (!property || property->value->count != size) return false;
    std::memcpy(value, property->value->GetPayload(), size);
    return true;
}

void const* InSerialiser::LoadTypeCustomArrayI(IDTag tag, u64 unitSize, u64& count) const
{
    Property const* const property = FindValueI(tag, ArrayByte(PropType::Custom));
    if (!property || property->value->extra != unitSize) return nullptr;
    count = property->value->count;
    return property->value->GetPayload();
}

bool InSerialiser::LoadRawStructI(IDTag tag, void* value, u64 size) const
{
    if (size == 0 || size > c_maxRawStructSize) return false;
    return LoadTypeI(tag, RawStructType(size), value, size);
}

bool InSerialiser::LoadRawData(IDTag tag, RawDataBlock& data, bool swap) const
{
    Property const* const property = FindKindI(tag, Type::RawData);
    if (!property) return false;
    if (swap) {
        data.Swap(*property->rawData);
        return true;
    }
    RawDataBlock const& stored = *property->rawData;
    RawDataBlock copy(stored.GetSize());
    if (stored.GetSize() > 0 && (!copy.GetData() || !stored.GetData())) return false;
    if (stored.GetSize() > 0) std::memcpy(copy.GetData(), stored.GetData(), stored.GetSize());
    data.Swap(copy);
    return true;
}

bool InSerialiser::LoadFragmentedRawData(IDTag tag, Counted<FragmentedRawData>& data) const
{
    Property const* const property = FindKindI(tag, Type::FragmentedRawData);
    if (!property) return false;
    StoredFragments& fragments = *property->fragments;
    if (!fragments.data) {
        Counted<FragmentedRawData> made(new FragmentedRawData(fragments.blockSize));
        if (!made->SetData(0, fragments.bytes, fragments.size, false)) return false;
        fragments.data = std::move(made);
    }
    data = fragments.data;
    return true;
}

bool InSerialiser::LoadDataStream(IDTag tag, InSerialiserPropertyDataStream& stream) const
{
    Property const* const property = FindKindI(tag, Type::DataStream);
    if (!property) return false;
    StoredDataStream const& stored = *property->dataStream;
    stream.Init(stored.items, stored.items + stored.size, stored.version);
    return true;
}

// Enumerations and flags.

bool InSerialiser::LoadEnumI(IDTag tag, EnumSerialiser const& serialiser, int& value) const
{
    Property const* const property = FindValueI(tag, ScalarByte(PropType::Enum));
    if (!property) return false;
    serialiser.DecodeFromSerial(static_cast<u16>(property->number), static_cast<u16>(property->number >> 16), value);
    return true;
}

bool InSerialiser::LoadEnumI(IDTag tag, EnumSerialiser const& serialiser, std::vector<int>& values) const
{
    Property const* const property = FindValueI(tag, ArrayByte(PropType::Enum));
    if (!property) return false;
    StoredValue const& stored = *property->value;
    serialiser.DecodeFromSerial(reinterpret_cast<unsigned short const*>(stored.GetPayload()), stored.count,
                                static_cast<u16>(stored.extra), values);
    return true;
}

bool InSerialiser::LoadEnumI(IDTag tag, EnumSerialiser const& serialiser, int* values, u64 capacity, u64* stored) const
{
    Property const* const property = FindValueI(tag, ArrayByte(PropType::Enum));
    u64 copied = 0;
    if (!property || !ChooseCount(property->value->count, capacity, stored, copied)) return false;
    serialiser.DecodeFromSerial(reinterpret_cast<unsigned short const*>(property->value->GetPayload()), copied,
                                static_cast<u16>(property->value->extra), values, capacity);
    if (stored) *stored = property->value->count;
    return true;
}

bool InSerialiser::LoadFlagSetI(IDTag tag, FlagSerialiser const& serialiser, u64& flags, unsigned char width) const
{
    Property const* const property = FindValueI(tag, ScalarByte(PropType::FlagSet));
    if (!property || property->value->count > sizeof(u64)) return false;
    u64 encoded = 0;
    std::memcpy(&encoded, property->value->GetPayload(), property->value->count);
    u64 decoded = 0;
    unsigned char activeBytes = 0;
    serialiser.DecodeFromSerial(encoded, static_cast<u16>(property->value->extra), decoded, activeBytes);
    if (activeBytes > width) return false;
    flags = decoded;
    return true;
}

// Objects.

bool InSerialiser::LoadObjectI(IDTag tag, Counted<Serialisable>& object, bool owner) const
{
    Property const* const property = FindPropertyOrDefaultI(tag);
    if (!property || (property->kind != Type::Object && property->kind != Type::NullObject)) return false;
    object = property->object;
    if (m_markers) m_markers->CountLoad(property->object, owner);
    return true;
}

bool InSerialiser::LoadSharedObjectI(IDTag tag, Consolidated<SharedSerialisable>& object) const
{
    Property const* const property = FindPropertyOrDefaultI(tag);
    if (!property || (property->kind != Type::SharedObject && property->kind != Type::NullObject)) return false;
    object = Consolidated<SharedSerialisable>::Trust(property->shared);
    return true;
}

bool InSerialiser::LoadObjectOrSharedObjectI(IDTag tag, Counted<Serialisable>& object,
                                             Consolidated<SharedSerialisable>& shared, bool owner) const
{
    Counted<Serialisable> plain;
    Consolidated<SharedSerialisable> canonical;
    if (!LoadObjectI(tag, plain, owner) && !LoadSharedObjectI(tag, canonical)) return false;
    object = std::move(plain);
    shared = std::move(canonical);
    return true;
}

template <class T>
bool InSerialiser::LoadArrayI(IDTag tag, PropertyType kind, T* const*& objects, u64& count) const
{
    Property const* const property = FindPropertyOrDefaultI(tag);
    if (!property || (property->kind != kind && property->kind != Type::NullArray)) return false;
    bool const isNull = property->kind == Type::NullArray;
    objects = isNull ? nullptr : property->objects->GetObjects<T>();
    count = isNull ? property->number : property->objects->count;
    return true;
}

bool InSerialiser::LoadObjectsI(IDTag tag, Serialisable* const*& objects, u64& count, bool owner) const
{
    if (!LoadArrayI(tag, Type::ObjectArray, objects, count)) return false;
    for (u64 i = 0; m_markers && objects && i < count; ++i) m_markers->CountLoad(objects[i], owner);
    return true;
}

bool InSerialiser::LoadSharedObjectsI(IDTag tag, SharedSerialisable* const*& objects, u64& count) const
{
    return LoadArrayI(tag, Type::SharedObjectArray, objects, count);
}

bool InSerialiser::LoadObjectsBase(IDTag tag, std::vector<Counted<Serialisable>>& objects, bool owner) const
{
    Serialisable* const* stored = nullptr;
    u64 count = 0;
    if (!LoadObjectsI(tag, stored, count, owner)) return false;
    if (stored)
        objects.assign(stored, stored + count);
    else
        objects.assign(count, nullptr);
    return true;
}

bool InSerialiser::LoadSharedObjectsBase(IDTag tag, std::vector<Consolidated<SharedSerialisable>>& objects) const
{
    SharedSerialisable* const* stored = nullptr;
    u64 count = 0;
    if (!LoadSharedObjectsI(tag, stored, count)) return false;
    objects.assign(count, nullptr);
    for (u64 i = 0; stored && i < count; ++i) objects[i] = Consolidated<SharedSerialisable>::Trust(stored[i]);
    return true;
}

// Inline classes.

Counted<InSerialiser const> InSerialiser::LoadClassI(IDTag tag, ClassUID& uid, unsigned short& version) const
{
    Property const* const property = FindKindI(tag, Type::Class);
    if (!property) return nullptr;
    uid = property->inlineClass->uid;
    version = property->inlineClass->version;
    return property->inlineClass->list;
}

std::vector<Counted<InSerialiser const>> const* InSerialiser::LoadClassesI(IDTag tag, ClassUID& uid,
                                                                           unsigned short& version) const
{
    Property const* const property = FindKindI(tag, Type::ClassArray);
    if (!property) return nullptr;
    uid = property->classes->uid;
    version = property->classes->version;
    return &property->classes->lists;
}

bool InSerialiser::LoadDelayLoadObject(IDTag tag, Counted<DelayLoadHolder>& holder) const
{
    Property const* const property = FindKindI(tag, Type::DelayLoad);
    if (!property) return false;
    holder = property->holder;
    return true;
}

} // namespace Kernel
