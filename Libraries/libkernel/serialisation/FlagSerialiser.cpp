#include "libkernel/serialisation/FlagSerialiser.h"

#include <algorithm>

namespace Kernel {

namespace {

bool IsBit(int bit)
{
    return bit >= 0 && bit < 64;
}

} // namespace

UnknownFlagVersionException::~UnknownFlagVersionException() = default;

void FlagSerialiser::RegisterFlagIndices(FlagIndex const* entries, u64 count)
{
    if (!entries || count == 0 || count > 64) return;
    Set set{Shape::Any, 0, {entries, entries + count}};
    set.shape = Classify(set.entries);
    for (FlagIndex const& entry : set.entries) {
        if (entry.retired || !IsBit(entry.bit)) continue;
        set.activeBytes = std::max(set.activeBytes, static_cast<u8>(entry.bit / 8 + 1));
    }
    m_sets.push_back(std::move(set));
}

FlagSerialiser::Shape FlagSerialiser::Classify(std::vector<FlagIndex> const& entries)
{
    for (u64 i = 0; i < entries.size(); ++i) {
        bool const follows = i == 0 || entries[i].bit == entries[i - 1].bit + 1;
        if (entries[i].retired || !IsBit(entries[i].bit) || !follows) return Shape::Any;
    }
    return entries[0].bit == 0 ? Shape::FromZero : Shape::FromBase;
}

bool FlagSerialiser::Set::Encode(u64 flags, u64& encoded) const
{
    if (shape != Shape::Any) {
        encoded = flags >> entries[0].bit;
        return true;
    }
    u64 left = flags;
    u64 result = 0;
    for (u64 i = 0; i < entries.size(); ++i) {
        if (entries[i].retired || !IsBit(entries[i].bit)) continue;
        u64 const bit = u64{1} << entries[i].bit;
        if (flags & bit) result |= u64{1} << i;
        left &= ~bit;
    }
    if (left) return false;
    encoded = result;
    return true;
}

u64 FlagSerialiser::Set::Decode(u64 encoded) const
{
    if (shape != Shape::Any) return encoded << entries[0].bit;
    u64 flags = 0;
    for (u64 i = 0; i < entries.size(); ++i)
        if ((encoded >> i & 1) && IsBit(entries[i].bit)) flags |= u64{1} << entries[i].bit;
    return flags;
}

bool FlagSerialiser::EncodeToSerial(u64 flags, u64& encoded, unsigned short& version) const
{
    // A version has 16 bits in a file; later sets can't be named.
    u64 const sets = std::min<u64>(m_sets.size(), 65536);
    for (u64 i = 0; i < sets; ++i) {
        if (!m_sets[i].Encode(flags, encoded)) continue;
        version = static_cast<unsigned short>(i);
        return true;
    }
    return false;
}

void FlagSerialiser::DecodeFromSerial(u64 encoded, unsigned short version, u64& flags, unsigned char& activeBytes) const
{
    if (version >= m_sets.size()) throw UnknownFlagVersionException();
    Set const& set = m_sets[version];
    u64 const count = set.entries.size();
    if (count < 64 && encoded >> count != 0) throw UnknownFlagVersionException();
    flags = set.Decode(encoded);
    activeBytes = set.activeBytes;
}

u8 FlagSerialiser::GetStoredBytes(u64 encoded)
{
    u8 bytes = 0;
    for (; encoded; encoded >>= 8) ++bytes;
    return bytes;
}

} // namespace Kernel
