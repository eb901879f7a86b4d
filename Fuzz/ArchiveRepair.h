#pragma once

#include "FuzzTarget.h"
#include "libkernel/core/Endian.h"
#include "libkernel/streams/CRC32.h"

#include <algorithm>
#include <cstring>

extern "C" size_t LLVMFuzzerMutate(uint8_t* data, size_t size, size_t maxSize);
extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed);

namespace Kernel::Fuzz {

/// Puts the fields of an archive file right that nothing but chance would: magic and tags, FileEnd and body sizes, the
/// CRCs of stored blocks, and of the data where it is stored as it is.
class ArchiveRepair
{
public:
    ArchiveRepair(u8* data, u64 size) : m_data(data), m_size(size) {}

    void Repair()
    {
        if (m_size < 72) return;
        std::memcpy(m_data, "\x00\xFF\x4B\x41", 4);
        u16 const version = static_cast<u16>(7 + LoadLittleEndian<u16>(m_data + 4) % 5);
        StoreLittleEndian(m_data + 4, version);
        std::memcpy(m_data + 12, "#Inf", 4);
        if (version >= 8) std::memcpy(m_data + 64, "Prot", 4);
        u64 table = LoadLittleEndian<u64>(m_data + 16);
        u64 above = m_size;
        for (int steps = 0; steps < 100 && table >= 64 && table < above && m_size - table >= c_header; ++steps) {
            RepairTable(table, steps == 0);
            above = table;
            table = LoadLittleEndian<u64>(m_data + table + 4);
        }
    }

private:
    static constexpr u64 c_header = 59;

    void RepairTable(u64 table, bool isNewest)
    {
        static constexpr char const* c_tags[] = {"#FAT", "#FT2", "#FT3", "#FT4"};
        static constexpr u64 c_details[] = {29, 33, 33, 37};
        u8* const head = m_data + table;
        u64 kind = 0;
        while (kind < 4 && std::memcmp(head, c_tags[kind], 4) != 0) ++kind;
        if (kind == 4) std::memcpy(head, c_tags[kind = head[3] % 4], 4);
        u64 at = table + c_header;
        for (u32 n = LoadLittleEndian<u32>(head + 36); n != 0; --n) {
            if (m_size - at < 5) return;
            u8& change = m_data[at + 4];
            change = static_cast<u8>(change % 3);
            at += 5;
            if (change == 2) continue;
            if (m_size - at < c_details[kind] + 2) return;
            RepairBlock(m_data + at, kind == 3);
            at += c_details[kind];
            if (change != 0) continue;
            u64 const length = LoadLittleEndian<u16>(m_data + at);
            if (m_size - at - 2 < length) return;
            at += 2 + length;
        }
        for (u16 n = LoadLittleEndian<u16>(head + 56); n != 0 && n < 100; --n) {
            if (m_size - at < 12) return;
            u64 const length = u64{LoadLittleEndian<u16>(m_data + at)} + LoadLittleEndian<u16>(m_data + at + 2);
            if (m_size - at - 12 < length) return;
            at += 12 + length;
        }
        u64 const userData = LoadLittleEndian<u32>(head + 48);
        if (m_size - at < userData) return;
        at += userData;
        StoreLittleEndian(head + 52, static_cast<u32>(at - table - c_header));
        StoreLittleEndian(head + 20, at);
        if (isNewest) StoreLittleEndian(m_data + 24, at);
    }

    // Position, size, stored size, CRC, code and, in today's tables, build and CRC of what is stored.
    void RepairBlock(u8* details, bool hasStoredCrc)
    {
        u64 const position = LoadLittleEndian<u64>(details);
        u64 const stored = LoadLittleEndian<u64>(details + 16);
        if (position > m_size || m_size - position < 8 || m_size - position - 8 < stored) return;
        u8* const bytes = m_data + position + 4;
        std::memcpy(bytes - 4, "#Fil", 4);
        std::memset(bytes + stored, 0xFF, 4);
        u32 crc = 0;
        CRC32::DataCRC32(bytes, stored, crc);
        if (hasStoredCrc) StoreLittleEndian(details + 33, std::max(crc, 1u));
        if ((details[28] & 3) != 0) return;
        StoreLittleEndian(details + 8, stored);
        StoreLittleEndian(details + 24, crc);
    }

    u8* const m_data;
    u64 const m_size;
};

} // namespace Kernel::Fuzz
