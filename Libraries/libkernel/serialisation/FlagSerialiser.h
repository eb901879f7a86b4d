#pragma once

#include "libkernel/core/Exception.h"
#include "libkernel/core/Types.h"

#include <vector>

namespace Kernel {

/// A stored flag set has a version or a bit that the program does not know.
class KERNEL_API UnknownFlagVersionException : public Exception
{
public:
    ~UnknownFlagVersionException() override;
};

/// Keeps the bits of one flag word stable on disk while their numbers in the code change; the plan and the thread rule
/// are those of EnumSerialiser.
class KERNEL_API FlagSerialiser
{
public:
    struct FlagIndex
    {
        int bit;         ///< 0 to 63, in the program's flag word. The entry's position is the bit in the stored one.
        int retired = 0; ///< Not 0: still decodes, but is never used for encoding.
    };

    /// Appends a set. Ignored if @p entries is null, or @p count is 0 or above 64.
    void RegisterFlagIndices(FlagIndex const* entries, u64 count);
    template <u64 N>
    void RegisterFlagIndices(FlagIndex const (&entries)[N])
    {
        RegisterFlagIndices(entries, N);
    }

    /// False, with the outputs untouched, if no set has a place for every bit of @p flags. A set of bits that ascend by
    /// 1, none retired, is not asked: it takes any flags, shifted down.
    bool EncodeToSerial(u64 flags, u64& encoded, unsigned short& version) const;
    /// Gives the flags, and in @p activeBytes the bytes of the program's word that the set reaches. Throws
    /// UnknownFlagVersionException for a version beyond those registered, and for a bit beyond a set of fewer than 64.
    void DecodeFromSerial(u64 encoded, unsigned short version, u64& flags, unsigned char& activeBytes) const;

    /// Bytes that a stored flag set takes: those of @p encoded without the trailing zeros. The width of the program's
    /// flag word does not come in, since a set may place the flags of a narrow word further up.
    static u8 GetStoredBytes(u64 encoded);

private:
    enum class Shape : u8
    {
        FromZero = 0, // Ascending by 1 from bit 0, none retired.
        FromBase = 1, // Ascending by 1 from another bit, none retired.
        Any = 2
    };
    struct Set
    {
        Shape shape;
        u8 activeBytes; // The largest bit / 8 + 1 over the entries that are not retired.
        std::vector<FlagIndex> entries;

        bool Encode(u64 flags, u64& encoded) const;
        u64 Decode(u64 encoded) const;
    };
    static Shape Classify(std::vector<FlagIndex> const& entries);

    std::vector<Set> m_sets;
};

} // namespace Kernel
