#include "libkernel/serialisation/OutSerialiserPropertyDataStream.h"

#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/Endian.h"
#include "libkernel/serialisation/internal/OutSerialiserInline.h"
#include "libkernel/serialisation/internal/PropWriter.h"

#include <cstring>

namespace Kernel {

namespace {

using SaveException = OutSerialiser::SaveException;

constexpr u8 ArrayOf(PropType type)
{
    return static_cast<u8>(type) | c_propArrayBit;
}

} // namespace

OutSerialiserPropertyDataStream::OutSerialiserPropertyDataStream(OutSerialiser& out, IDTag tag, unsigned short version)
    : m_out(out)
{
    if (out.HaveChildActive()) Fail(SaveException::Misuse);
    if (out.IsFullSave()) {
        out.StartI(tag);
        StoreLittleEndian(out.PutHeaderI(tag, static_cast<u8>(PropType::DataStream), 2), version);
    }
    out.m_obstacles |= OutSerialiser::ChildActive;
}

OutSerialiserPropertyDataStream::~OutSerialiserPropertyDataStream()
{
    m_out.m_obstacles &= static_cast<u8>(~OutSerialiser::ChildActive);
}

void OutSerialiserPropertyDataStream::Fail(int code, SourceLocation where) const
{
    m_out.Fail(code, where);
}

void OutSerialiserPropertyDataStream::Close()
{
    if (m_isClosed) return;
    if (m_out.IsFullSave()) *m_out.ClaimI(1) = 0;
    m_isClosed = true;
}

// False on a pass that writes nothing.
bool OutSerialiserPropertyDataStream::StartValueI() const
{
    if (m_isClosed) Fail(SaveException::Misuse);
    return m_out.IsFullSave();
}

void OutSerialiserPropertyDataStream::CheckTypeI(PropType type, u64 size) const
{
    u8 const number = static_cast<u8>(type);
    if (size == 0 || number >= c_propTypeCount || c_propSizes[number] != size) Fail(SaveException::Misuse);
}

void OutSerialiserPropertyDataStream::SaveValueI(PropType type, void const* value, u64 size)
{
    if (!StartValueI()) return;
    CheckTypeI(type, size);
    u8* const to = m_out.ClaimI(1 + size);
    *to = static_cast<u8>(type);
    std::memcpy(to + 1, value, size);
}

void OutSerialiserPropertyDataStream::SaveValueArrayI(PropType type, void const* values, u64 unitSize, u64 count)
{
    if (!StartValueI()) return;
    CheckTypeI(type, unitSize);
    StartNewValueArrayI(type, count);
    AppendI(values, unitSize * count);
}

void OutSerialiserPropertyDataStream::StartNewValueArrayI(PropType type, u64 count)
{
    if (!StartValueI()) return;
    // Bits have no elements that could be appended.
    u8 const number = static_cast<u8>(type);
    if (number >= c_propTypeCount || c_propSizes[number] == 0 || type == PropType::Bool) Fail(SaveException::Misuse);
    u32 const stored = m_out.CheckCountI(count);
    u8* const header = m_out.ClaimI(5);
    header[0] = ArrayOf(type);
    StoreLittleEndian(header + 1, stored);
}

void OutSerialiserPropertyDataStream::StartNewValueCustomPackI(u64 unitSize, u64 count)
{
    if (!StartValueI()) return;
    u32 const storedCount = m_out.CheckCountI(count);
    u16 const storedSize = m_out.CheckShortI(unitSize);
    u8* const header = m_out.ClaimI(7);
    header[0] = ArrayOf(PropType::Custom);
    StoreLittleEndian(header + 1, storedCount);
    StoreLittleEndian(header + 5, storedSize);
}

void OutSerialiserPropertyDataStream::AppendI(void const* bytes, u64 size)
{
    if (StartValueI()) m_out.PutI(bytes, size);
}

void OutSerialiserPropertyDataStream::SaveBoolI(bool value)
{
    u8 const byte = value ? 1 : 0;
    SaveValueI(PropType::Bool, &byte, 1);
}

template <class Bools>
void OutSerialiserPropertyDataStream::SaveBoolsI(Bools const& values, u64 count)
{
    if (!StartValueI()) return;
    m_out.CheckCountI(count);
    *m_out.ClaimI(1) = ArrayOf(PropType::Bool);
    PropWriter(m_out).PutBools(values, count);
}

void OutSerialiserPropertyDataStream::SaveValues(bool const* values, u64 count)
{
    SaveBoolsI(values, count);
}

void OutSerialiserPropertyDataStream::SaveValues(std::vector<bool> const& values)
{
    SaveBoolsI(values, values.size());
}

void OutSerialiserPropertyDataStream::SaveValues(std::deque<bool> const& values)
{
    SaveBoolsI(values, values.size());
}

void OutSerialiserPropertyDataStream::SaveStringI(char const* utf8, u64 length)
{
    if (!StartValueI()) return;
    u32 const stored = m_out.CheckCountI(length);
    u8* const header = m_out.ClaimI(5);
    header[0] = static_cast<u8>(PropType::String);
    StoreLittleEndian(header + 1, stored);
    m_out.PutI(utf8, length);
}

void OutSerialiserPropertyDataStream::SaveValue(String8 const& text)
{
    SaveStringI(text.GetData(), static_cast<u64>(text.GetLength()));
}

void OutSerialiserPropertyDataStream::SaveValue(String16 const& text)
{
    SaveValue(ConvertedTo<TEncUtf8>(text));
}

void OutSerialiserPropertyDataStream::SaveValue(String32 const& text)
{
    SaveValue(ConvertedTo<TEncUtf8>(text));
}

void OutSerialiserPropertyDataStream::SaveValues(String8 const* texts, u64 count)
{
    if (!StartValueI()) return;
    PropWriter writer(m_out);
    u32 const total = writer.CheckTexts(texts, count);
    *m_out.ClaimI(1) = ArrayOf(PropType::String);
    writer.PutTexts(texts, count, total);
}

void OutSerialiserPropertyDataStream::SaveValues(String16 const* texts, u64 count)
{
    SaveValues(PropWriter::ConvertTexts(texts, count).data(), count);
}

void OutSerialiserPropertyDataStream::SaveValues(String32 const* texts, u64 count)
{
    SaveValues(PropWriter::ConvertTexts(texts, count).data(), count);
}

void OutSerialiserPropertyDataStream::SaveValueStructI(void const* value, u64 size)
{
    if (!StartValueI()) return;
    u16 const stored = m_out.CheckShortI(size);
    u8* const header = m_out.ClaimI(3);
    header[0] = static_cast<u8>(PropType::Custom);
    StoreLittleEndian(header + 1, stored);
    m_out.PutI(value, size);
}

void OutSerialiserPropertyDataStream::SaveValueStructArrayI(void const* values, u64 unitSize, u64 count)
{
    StartNewValueCustomPackI(unitSize, count);
    AppendI(values, unitSize * count);
}

void OutSerialiserPropertyDataStream::SaveValueRaw(void const* bytes, u64 size)
{
    if (!StartValueI()) return;
    u32 const stored = m_out.CheckCountI(size);
    u8* const header = m_out.ClaimI(5);
    header[0] = static_cast<u8>(PropType::RawData);
    StoreLittleEndian(header + 1, stored);
    m_out.PutI(bytes, size);
}

void OutSerialiserPropertyDataStream::SaveEnumI(EnumSerialiser const& serialiser, int value)
{
    if (!StartValueI()) return;
    unsigned short code = 0;
    unsigned short version = 0;
    if (!serialiser.EncodeToSerial(value, code, version)) Fail(SaveException::NoEncoding);
    u8* const to = m_out.ClaimI(5);
    to[0] = static_cast<u8>(PropType::Enum);
    StoreLittleEndian(to + 1, code);
    StoreLittleEndian(to + 3, version);
}

void OutSerialiserPropertyDataStream::SaveEnumsI(EnumSerialiser const& serialiser, int const* values, u64 count)
{
    if (!StartValueI()) return;
    u32 const stored = m_out.CheckCountI(count);
    std::vector<unsigned short> codes;
    unsigned short version = 0;
    if (!serialiser.EncodeToSerial(values, count, codes, version)) Fail(SaveException::NoEncoding);
    u8* const header = m_out.ClaimI(7);
    header[0] = ArrayOf(PropType::Enum);
    StoreLittleEndian(header + 1, stored);
    StoreLittleEndian(header + 5, version);
    m_out.PutI(codes.data(), codes.size() * sizeof(u16));
}

} // namespace Kernel
