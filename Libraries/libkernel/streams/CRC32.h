#pragma once

#include "libkernel/core/Types.h"

namespace Kernel {

/// The CRC-32 of ISO 3309, which PNG, zip and gzip use: reflected polynomial 0xEDB88320, all ones before, all bits
/// inverted behind. The check value of "123456789" is 0xCBF43926; of no bytes at all it is 0.
///
/// A running value is begun, fed any number of times, and ended; it is not the CRC until it has been ended. Everything
/// may be called from any thread: nothing but constant tables is shared. Where the processor has carry-less
/// multiplication, long pieces run several bytes a clock; elsewhere a table takes sixteen bytes a step.
class KERNEL_API CRC32
{
public:
    static CRC32 const& Instance();

    static void BeginCRC32(u32& crc) { crc = 0xFFFFFFFFu; }
    /// Folds one byte into the running value.
    static void CalcCRC32(u8 byte, u32& crc);
    /// Folds @p count bytes in; there is no need for @p data to be aligned.
    static void CalcCRC32(void const* data, u64 count, u32& crc);
    static void EndCRC32(u32& crc) { crc = ~crc; }

    /// The three steps at once. False, with @p crc 0, if @p data is null and @p count is not 0.
    static bool DataCRC32(void const* data, u64 count, u32& crc);
    /// As DataCRC32, for a terminated text without its terminator. False if @p text is null.
    static bool StringCRC32(char const* text, u32& crc);

    CRC32(CRC32 const&) = delete;
    CRC32& operator=(CRC32 const&) = delete;

private:
    CRC32() = default;
};

} // namespace Kernel
