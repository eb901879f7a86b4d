#include "libkernel/serialisation/InSerialiserPropertyDataStream.h"

#include "libkernel/core/ConvertEnc.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/internal/PropertyWire.h"

#include <climits>
#include <string_view>
#include <utility>

namespace Kernel {

namespace {

template <class Enc>
bool MakeText(u8 const* bytes, u64 size, StringT<Enc>& text)
{
    if (size > INT_MAX / 2) return false;
    StringT<Enc> made;
    ConvertEnc<Enc, TEncUtf8>(made, reinterpret_cast<char const*>(bytes), static_cast<int>(size));
    text = std::move(made);
    return true;
}

} // namespace

void InSerialiserPropertyDataStream::Init(u8 const* at, u8 const* end, unsigned short version)
{
    *this = InSerialiserPropertyDataStream();
    m_next = at;
    m_end = end;
    m_version = version;
    LoadNextItem();
}

void InSerialiserPropertyDataStream::LoadNextItem()
{
    m_type = PropType::EndOfList;
    m_isArray = false;
    if (m_next == m_end) return;
    u8 const typeByte = *m_next;
    WireHeader const header = DecodeWireHeader(typeByte, m_next + 1);
    m_payload = m_next + 1 + GetWireHeaderSize(typeByte);
    m_payloadSize = header.payload;
    m_next = m_payload + header.payload;
    m_type = static_cast<PropType>(GetWireType(typeByte));
    m_isArray = IsWireArray(typeByte);
    m_count = header.count;
    m_enumVersion = static_cast<u16>(header.extra);
    WireForm const form = c_wireTypes[GetWireType(typeByte)].form;
    m_unitSize = form == WireForm::Fixed                                 ? c_propSizes[GetWireType(typeByte)]
                 : form == WireForm::Custom && m_isArray                 ? header.extra
                 : form == WireForm::Custom || form == WireForm::RawData ? header.payload
                                                                         : 0;
}

u64 InSerialiserPropertyDataStream::GetStructByteSize() const
{
    bool const isStruct = m_type > PropType::RawStruct && m_type < PropType::FlagSet;
    return isStruct || m_type == PropType::Custom || m_type == PropType::RawData ? m_unitSize : 0;
}

bool InSerialiserPropertyDataStream::LoadValueI(PropType type, void* value, u64 size)
{
    if (type == PropType::Bool || type == PropType::Custom || type == PropType::RawData) return false;
    if (!IsCurrent(type, false) || m_unitSize != size || size == 0) return false;
    std::memcpy(value, m_payload, size);
    LoadNextItem();
    return true;
}

void const* InSerialiserPropertyDataStream::LoadValueArrayI(PropType type, u64 unitSize, u64& count)
{
    if (type == PropType::Bool || type == PropType::Custom || type == PropType::RawData) return nullptr;
    if (!IsCurrent(type, true) || m_unitSize != unitSize || unitSize == 0) return nullptr;
    void const* const values = m_payload;
    count = m_count;
    LoadNextItem();
    return values;
}

bool InSerialiserPropertyDataStream::LoadValue(bool& value)
{
    if (!IsCurrent(PropType::Bool, false)) return false;
    value = *m_payload != 0;
    LoadNextItem();
    return true;
}

template <class Enc>
bool InSerialiserPropertyDataStream::LoadTextI(StringT<Enc>& text)
{
    if (!IsCurrent(PropType::String, false) || !MakeText(m_payload, m_payloadSize, text)) return false;
    LoadNextItem();
    return true;
}

bool InSerialiserPropertyDataStream::LoadValue(String8& text)
{
    return LoadTextI(text);
}

bool InSerialiserPropertyDataStream::LoadValue(String16& text)
{
    return LoadTextI(text);
}

bool InSerialiserPropertyDataStream::LoadValue(String32& text)
{
    return LoadTextI(text);
}

template <class Bools>
bool InSerialiserPropertyDataStream::LoadBoolsI(Bools& values)
{
    if (!IsCurrent(PropType::Bool, true)) return false;
    values.resize(m_count);
    for (u64 i = 0; i < m_count; ++i) values[i] = (m_payload[i / 8] >> (i % 8) & 1) != 0;
    LoadNextItem();
    return true;
}

bool InSerialiserPropertyDataStream::LoadValues(std::vector<bool>& values)
{
    return LoadBoolsI(values);
}

bool InSerialiserPropertyDataStream::LoadValues(std::deque<bool>& values)
{
    return LoadBoolsI(values);
}

template <class Enc>
bool InSerialiserPropertyDataStream::LoadTextsI(std::vector<StringT<Enc>>& texts)
{
    if (!IsCurrent(PropType::String, true)) return false;
    std::vector<StringT<Enc>> loaded(m_count);
    u8 const* at = m_payload;
    for (StringT<Enc>& text : loaded) {
        u32 const length = LoadLittleEndian<u32>(at);
        if (!MakeText(at + sizeof(length), length, text)) return false;
        at += sizeof(length) + length;
    }
    texts = std::move(loaded);
    LoadNextItem();
    return true;
}

bool InSerialiserPropertyDataStream::LoadValues(std::vector<String8>& texts)
{
    return LoadTextsI(texts);
}

bool InSerialiserPropertyDataStream::LoadValues(std::vector<String16>& texts)
{
    return LoadTextsI(texts);
}

bool InSerialiserPropertyDataStream::LoadValues(std::vector<String32>& texts)
{
    return LoadTextsI(texts);
}

bool InSerialiserPropertyDataStream::LoadValueCustomI(void* value, u64 size)
{
    if (!IsCurrent(PropType::Custom, false) || m_payloadSize != size) return false;
    if (size) std::memcpy(value, m_payload, size);
    LoadNextItem();
    return true;
}

void const* InSerialiserPropertyDataStream::LoadValueCustomArrayI(u64 unitSize, u64& count)
{
    if (!IsCurrent(PropType::Custom, true) || m_unitSize != unitSize) return nullptr;
    void const* const values = m_payload;
    count = m_count;
    LoadNextItem();
    return values;
}

bool InSerialiserPropertyDataStream::LoadValueRaw(RawDataBlock& data)
{
    if (!IsCurrent(PropType::RawData, false)) return false;
    RawDataBlock copy(m_payloadSize);
    if (m_payloadSize > 0) {
        if (!copy.GetData()) return false;
        std::memcpy(copy.GetData(), m_payload, m_payloadSize);
    }
    data.Swap(copy);
    LoadNextItem();
    return true;
}

bool InSerialiserPropertyDataStream::LoadEnumI(EnumSerialiser const& serialiser, int& value)
{
    if (!IsCurrent(PropType::Enum, false)) return false;
    serialiser.DecodeFromSerial(LoadLittleEndian<u16>(m_payload), LoadLittleEndian<u16>(m_payload + 2), value);
    LoadNextItem();
    return true;
}

bool InSerialiserPropertyDataStream::LoadEnumI(EnumSerialiser const& serialiser, std::vector<int>& values)
{
    if (!IsCurrent(PropType::Enum, true)) return false;
    std::vector<unsigned short> codes(m_count);
    if (m_count) std::memcpy(codes.data(), m_payload, m_count * sizeof(u16));
    serialiser.DecodeFromSerial(codes.data(), m_count, m_enumVersion, values);
    LoadNextItem();
    return true;
}

} // namespace Kernel
