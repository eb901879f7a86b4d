#include "libkernel/core/Format.h"
#include "libkernel/core/Trace.h"
#include "libkernel/serialisation/FutureVersionException.h"
#include "libkernel/serialisation/internal/InSerialiserLoader.h"

namespace Kernel {

// The skip form of a parse, for classes that the program lacks and what belongs to them. Nothing is stored, but every
// rule of the format holds, and classes that are described on the way are known afterwards.

bool InSerialiserLoader::SkipProperties()
{
    for (;;) {
        u8 typeByte = 0;
        u32 tag = 0;
        if (!m_source.ReadItemByte(typeByte)) return false;
        if (typeByte == 0) return true;
        if (!IsKnownWireType(typeByte)) {
            Trace(FormatT<String8>(">>> Use of unknown prop type: %1\n", GetWireType(typeByte)));
            throw FutureVersionException(false);
        }
        if (!IsLegalWireType(typeByte) || !m_source.ReadNumber(tag) || !SkipPayload(typeByte)) return false;
    }
}

bool InSerialiserLoader::SkipPayload(u8 typeByte)
{
    bool const isArray = IsWireArray(typeByte);
    switch (c_wireTypes[GetWireType(typeByte)].form) {
    case WireForm::DataStream: return SkipDataStream();
    case WireForm::Object: return isArray ? SkipObjects() : SkipObject();
    case WireForm::Class: return isArray ? SkipClasses() : SkipClass();
    case WireForm::DelayLoad: return SkipDelayLoad();
    case WireForm::String:
        if (isArray) return SkipTexts();
        break;
    default: break;
    }
    WireHeader header;
    return ReadHeader(typeByte, header) && m_source.Skip(header.payload);
}

bool InSerialiserLoader::SkipTexts()
{
    u32 total = 0;
    u32 count = 0;
    if (!m_source.ReadNumber(total) || !m_source.ReadNumber(count) || !m_source.Fits(total)) return false;
    u64 left = total;
    for (; count > 0; --count) {
        u32 length = 0;
        if (left < sizeof(length) || !m_source.ReadNumber(length)) return false;
        left -= sizeof(length);
        if (length > left || !m_source.Skip(length)) return false;
        left -= length;
    }
    return left == 0;
}

bool InSerialiserLoader::SkipDataStream()
{
    u16 version = 0;
    if (!m_source.ReadNumber(version)) return false;
    m_source.OpenList();
    for (;;) {
        u8 typeByte = 0;
        if (!m_source.ReadItemByte(typeByte)) return false;
        if (typeByte == 0) break;
        if (!IsLegalInDataStream(typeByte) || !SkipPayload(typeByte)) return false;
    }
    m_source.CloseList();
    return true;
}

bool InSerialiserLoader::SkipObject()
{
    u8 first = 0;
    u32 index = 0;
    if (!m_source.ReadNumber(first)) return false;
    switch (static_cast<Kernel::ObjectRecord>(first)) {
    case Kernel::ObjectRecord::Null: return true;
    case Kernel::ObjectRecord::Back: return m_source.ReadNumber(index);
    case Kernel::ObjectRecord::First: break;
    default: return false;
    }
    // Only now, as in a parse: nulls and references are no level.
    NestingGuard const level;
    ClassResult result;
    if (!level.IsAllowed() || !m_source.ReadNumber(index)) return false;
    ++m_objectsBegun;
    if (!ReadClassRecord(result) || (!result.info && !result.isUnknown)) return false;
    m_source.OpenList();
    if (!SkipProperties()) return false;
    m_source.CloseList();
    return true;
}

bool InSerialiserLoader::SkipObjects()
{
    u32 count = 0;
    if (!m_source.ReadNumber(count) || !m_source.Fits(count)) return false;
    for (; count > 0; --count) {
        if (!SkipObject()) return false;
    }
    return true;
}

bool InSerialiserLoader::SkipClass()
{
    u8 isThere = 0;
    u32 uid = 0;
    u16 version = 0;
    if (!m_source.ReadNumber(isThere) || isThere > 1) return false;
    if (!isThere) return true;
    NestingGuard const level;
    if (!level.IsAllowed() || !m_source.ReadNumber(uid) || !m_source.ReadNumber(version)) return false;
    m_source.OpenList();
    if (!SkipProperties()) return false;
    m_source.CloseList();
    return true;
}

bool InSerialiserLoader::SkipClasses()
{
    u32 count = 0;
    u32 uid = 0;
    u16 version = 0;
    if (!m_source.ReadNumber(count) || !m_source.ReadNumber(uid) || !m_source.ReadNumber(version) ||
        !m_source.Fits(count))
        return false;
    for (; count > 0; --count) {
        u8 isThere = 0;
        if (!m_source.ReadNumber(isThere) || isThere > 1) return false;
        if (!isThere) continue;
        NestingGuard const level;
        m_source.OpenList();
        if (!level.IsAllowed() || !SkipProperties()) return false;
        m_source.CloseList();
    }
    return true;
}

bool InSerialiserLoader::SkipDelayLoad()
{
    u32 uid = 0;
    u32 length = 0;
    return m_source.ReadNumber(uid) && m_source.ReadNumber(length) && m_source.Skip(length);
}

} // namespace Kernel
