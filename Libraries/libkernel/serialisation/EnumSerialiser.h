#pragma once

#include "libkernel/core/Exception.h"
#include "libkernel/core/Types.h"

#include <unordered_map>
#include <vector>

namespace Kernel {

/// A stored enum version or code is not one that the program knows.
class KERNEL_API UnknownEnumVersionException : public Exception
{
public:
    ~UnknownEnumVersionException() override;
};

/// Keeps the values of one enum stable on disk while their numbers in the code change.
///
/// Holds one set for each version of the enum; the order of registration is the version stored in a file. A value is
/// stored as its position in the oldest set that has it, so that older readers can load it. Filled once, before other
/// threads use it; then only read.
class KERNEL_API EnumSerialiser
{
public:
    struct EnumEntry
    {
        int value;
        int retired = 0; ///< Not 0: still decodes, but is never used for encoding.
    };

    /// Appends a set. Ignored if @p entries is null, or @p count is 0 or not below 65,536.
    void RegisterEnumSet(EnumEntry const* entries, u64 count);
    template <u64 N>
    void RegisterEnumSet(EnumEntry const (&entries)[N])
    {
        RegisterEnumSet(entries, N);
    }

    /// False, with the outputs untouched, if no set knows @p value.
    bool EncodeToSerial(int value, unsigned short& code, unsigned short& version) const;
    /// Needs one set that knows every value; the first such gives the version. False if there is none, with the codes
    /// undefined. With @p count 0 the first set serves.
    bool EncodeToSerial(int const* values, u64 count, std::vector<unsigned short>& codes,
                        unsigned short& version) const;
    /// @p codes takes @p count codes.
    bool EncodeToSerial(int const* values, u64 count, unsigned short* codes, unsigned short& version) const;

    /// Gives the value. Throws UnknownEnumVersionException for a version or a code beyond those registered.
    void DecodeFromSerial(unsigned short code, unsigned short version, int& value) const;
    void DecodeFromSerial(unsigned short const* codes, u64 count, unsigned short version,
                          std::vector<int>& values) const;
    /// @p values takes @p count values.
    void DecodeFromSerial(unsigned short const* codes, u64 count, unsigned short version, int* values) const;
    /// Decodes the first min(count, capacity) codes.
    void DecodeFromSerial(unsigned short const* codes, u64 count, unsigned short version, int* values,
                          u64 capacity) const;

private:
    // Chosen at registration only to make encoding fast; each gives what a plain search would.
    enum class Shape : u8
    {
        FromZero = 0,  // Ascending by 1 from 0, none retired.
        FromBase = 1,  // Ascending by 1 from another number, none retired.
        Ascending = 2, // Strictly ascending with gaps, none retired.
        Any = 3
    };
    struct Set
    {
        Shape shape;
        std::vector<EnumEntry> entries;
        std::unordered_map<int, u16> positions; // Shape Any only; the entries that are not retired.

        bool Encode(int value, unsigned short& code) const;
    };
    static Shape Classify(std::vector<EnumEntry> const& entries);
    Set const& GetSet(unsigned short version) const;

    std::vector<Set> m_sets;
};

} // namespace Kernel
