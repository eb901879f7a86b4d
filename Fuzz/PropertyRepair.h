#pragma once

#include "FuzzTarget.h"
#include "libkernel/core/Endian.h"
#include "libkernel/serialisation/PropType.h"

#include <algorithm>

extern "C" size_t LLVMFuzzerMutate(uint8_t* data, size_t size, size_t maxSize);
extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed);

namespace Kernel::Fuzz {

/// Makes the bytes of a property list follow its grammar in place: types become known ones, and lengths and counts are
/// cut to what is left, so that a mutation reaches what stands behind it.
class PropertyRepair
{
public:
    PropertyRepair(u8* data, u64 size) : m_at(data), m_end(data + size) {}

    void RepairList(u32 depth)
    {
        while (m_at < m_end && *m_at) {
            u8 const byte = RepairType();
            Skip(5);
            RepairPayload(byte, depth);
        }
        Skip(1);
    }
    /// Items of a data stream have no tags.
    void RepairStream()
    {
        while (m_at < m_end && *m_at) {
            u8 const byte = RepairType();
            Skip(1);
            PropType const type = static_cast<PropType>(byte & 127);
            if (type >= PropType::DataStream && type <= PropType::DelayLoad) *(m_at - 1) = 3;
            RepairPayload(*(m_at - 1), 1);
        }
        Skip(1);
    }
    void RepairClassRecord(u32 depth)
    {
        u8 kind = Clip(2);
        for (; kind == 0; kind = Clip(2)) {
            Skip(6);
            RepairList(depth + 1);
        }
        if (kind == 1) Skip(4);
    }

private:
    u64 Left() const { return static_cast<u64>(m_end - m_at); }
    void Skip(u64 count) { m_at += std::min(count, Left()); }
    /// The next byte, brought to at most @p most, is taken. At the end it is as good as @p most.
    u8 Clip(u8 most)
    {
        if (m_at >= m_end) return most;
        *m_at = static_cast<u8>(*m_at % (most + 1));
        return *m_at++;
    }
    u8 RepairType()
    {
        u8 const type = static_cast<u8>((*m_at & 127) % c_propTypeCount);
        bool const isArray = (*m_at & c_propArrayBit) && type < 117 && type != 45 && type != 48 && type != 51;
        *m_at = static_cast<u8>((type ? type : 3) | (isArray ? c_propArrayBit : 0));
        return *m_at;
    }
    /// A field of four bytes, brought down to a count of @p unit bytes each that can be there.
    u32 Count(u64 unit, u64 ahead = 4)
    {
        if (Left() < 4) {
            m_at = m_end;
            return 0;
        }
        u32 count = LoadLittleEndian<u32>(m_at);
        u64 const room = Left() > ahead ? Left() - ahead : 0;
        if (unit && count > room / unit) count = static_cast<u32>(count % (room / unit + 1));
        StoreLittleEndian(m_at, count);
        m_at += 4;
        return count;
    }
    void RepairTexts()
    {
        u8* const total = m_at;
        Skip(4);
        u8* const start = m_at;
        for (u32 n = Count(4); n != 0; --n) Skip(Count(1));
        if (start - total == 4) StoreLittleEndian(total, static_cast<u32>(m_at - start - 4));
    }
    void RepairObject(u32 depth)
    {
        u8 const kind = Clip(2);
        if (kind == 0) return;
        Skip(4);
        if (kind == 2) return;
        RepairClassRecord(depth);
        RepairList(depth + 1);
    }
    void RepairPayload(u8 byte, u32 depth)
    {
        PropType const type = static_cast<PropType>(byte & 127);
        bool const isArray = (byte & c_propArrayBit) != 0;
        u32 const size = c_propSizes[byte & 127];
        if (depth > 200) return Skip(Left());
        if (size) {
            if (!isArray && type == PropType::Bool)
                Clip(1);
            else
                Skip(!isArray ? size : type == PropType::Bool ? (u64{Count(1)} + 7) / 8 : u64{Count(size)} * size);
            return;
        }
        switch (type) {
        case PropType::Enum: return Skip(isArray ? 2 + u64{Count(2, 6)} * 2 : 4);
        case PropType::String:
        case PropType::StringShaped: return isArray ? RepairTexts() : Skip(Count(1));
        case PropType::RawData: return Skip(Count(1));
        case PropType::AlignedRawData: {
            u32 const count = Count(1, 6);
            if (Left() >= 2) StoreLittleEndian(m_at, u16{0});
            return Skip(2 + u64{count});
        }
        case PropType::FragmentedRawData: return Skip(4 + u64{Count(1, 8)});
        case PropType::FlagSet: {
            Skip(2);
            return Skip(Clip(8));
        }
        case PropType::Custom: {
            u32 const count = isArray ? Count(1, 6) : 1;
            if (Left() < 2) return Skip(2);
            u16 const unit = static_cast<u16>(LoadLittleEndian<u16>(m_at) % ((Left() - 2) / (count ? count : 1) + 1));
            StoreLittleEndian(m_at, unit);
            return Skip(2 + u64{unit} * count);
        }
        case PropType::DataStream: {
            Skip(2);
            return RepairStream();
        }
        case PropType::Object:
            for (u32 n = isArray ? Count(1) : 1; n != 0; --n) RepairObject(depth);
            return;
        case PropType::Class: {
            u32 count = 1;
            if (isArray) {
                count = Count(1, 10);
                Skip(6);
            }
            for (; count != 0; --count) {
                if (Clip(1) == 0 || m_at >= m_end) continue;
                if (!isArray) Skip(6);
                RepairList(depth + 1);
            }
            return;
        }
        case PropType::DelayLoad: {
            Skip(4);
            return Skip(Count(1));
        }
        default: return;
        }
    }

    u8* m_at;
    u8* const m_end;
};

/// Mutates, and repairs three times of four. @p repair gets the bytes.
template <class Repair>
size_t MutateAndRepair(uint8_t* data, size_t size, size_t maxSize, unsigned seed, Repair&& repair)
{
    size = LLVMFuzzerMutate(data, size, maxSize);
    if (seed % 4 != 0) repair(data, size);
    return size;
}

/// The same for an input of which the first byte chooses how the stream delivers: the stream is given its header.
inline size_t MutateDelivered(uint8_t* data, size_t size, size_t maxSize, unsigned seed)
{
    return MutateAndRepair(data, size, maxSize, seed, [](u8* bytes, u64 count) {
        u64 const front = 1 + c_serialisedHeaderSize;
        if (count < front) return;
        StoreLittleEndian(bytes + 1, c_serialisedMagic);
        StoreLittleEndian(bytes + 5, c_serialisedFormatVersion);
        PropertyRepair(bytes + front, count - front).RepairList(0);
    });
}

} // namespace Kernel::Fuzz
