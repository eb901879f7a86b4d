#include "libkernel/serialisation/EnumSerialiser.h"

#include <algorithm>

namespace Kernel {

UnknownEnumVersionException::~UnknownEnumVersionException() = default;

void EnumSerialiser::RegisterEnumSet(EnumEntry const* entries, u64 count)
{
    if (!entries || count == 0 || count > 65535) return;
    Set set{Shape::Any, {entries, entries + count}, {}};
    set.shape = Classify(set.entries);
    if (set.shape == Shape::Any) {
        // Of two entries with one value the first counts, as in a search from the front.
        for (u64 i = 0; i < count; ++i)
            if (!entries[i].retired) set.positions.emplace(entries[i].value, static_cast<u16>(i));
    }
    m_sets.push_back(std::move(set));
}

EnumSerialiser::Shape EnumSerialiser::Classify(std::vector<EnumEntry> const& entries)
{
    bool stepsByOne = true;
    for (u64 i = 0; i < entries.size(); ++i) {
        if (entries[i].retired) return Shape::Any;
        if (i == 0) continue;
        if (entries[i].value <= entries[i - 1].value) return Shape::Any;
        // Ascending, so the predecessor of the value exists.
        stepsByOne &= entries[i].value - 1 == entries[i - 1].value;
    }
    if (!stepsByOne) return Shape::Ascending;
    return entries[0].value == 0 ? Shape::FromZero : Shape::FromBase;
}

bool EnumSerialiser::Set::Encode(int value, unsigned short& code) const
{
    switch (shape) {
    case Shape::FromZero:
    case Shape::FromBase: {
        i64 const position = i64{value} - entries[0].value;
        if (position < 0 || position >= static_cast<i64>(entries.size())) return false;
        code = static_cast<unsigned short>(position);
        return true;
    }
    case Shape::Ascending: {
        auto const found = std::ranges::lower_bound(entries, value, {}, &EnumEntry::value);
        if (found == entries.end() || found->value != value) return false;
        code = static_cast<unsigned short>(found - entries.begin());
        return true;
    }
    case Shape::Any: break;
    }
    auto const found = positions.find(value);
    if (found == positions.end()) return false;
    code = found->second;
    return true;
}

bool EnumSerialiser::EncodeToSerial(int value, unsigned short& code, unsigned short& version) const
{
    return EncodeToSerial(&value, 1, &code, version);
}

bool EnumSerialiser::EncodeToSerial(int const* values, u64 count, std::vector<unsigned short>& codes,
                                    unsigned short& version) const
{
    codes.resize(count);
    return EncodeToSerial(values, count, codes.data(), version);
}

bool EnumSerialiser::EncodeToSerial(int const* values, u64 count, unsigned short* codes, unsigned short& version) const
{
    // A version has 16 bits in a file; later sets can't be named.
    u64 const sets = std::min<u64>(m_sets.size(), 65536);
    for (u64 i = 0; i < sets; ++i) {
        u64 done = 0;
        while (done < count && m_sets[i].Encode(values[done], codes[done])) ++done;
        if (done < count) continue;
        version = static_cast<unsigned short>(i);
        return true;
    }
    return false;
}

EnumSerialiser::Set const& EnumSerialiser::GetSet(unsigned short version) const
{
    if (version >= m_sets.size()) throw UnknownEnumVersionException();
    return m_sets[version];
}

void EnumSerialiser::DecodeFromSerial(unsigned short code, unsigned short version, int& value) const
{
    DecodeFromSerial(&code, 1, version, &value);
}

void EnumSerialiser::DecodeFromSerial(unsigned short const* codes, u64 count, unsigned short version,
                                      std::vector<int>& values) const
{
    values.resize(count);
    DecodeFromSerial(codes, count, version, values.data());
}

void EnumSerialiser::DecodeFromSerial(unsigned short const* codes, u64 count, unsigned short version, int* values) const
{
    Set const& set = GetSet(version);
    for (u64 i = 0; i < count; ++i) {
        if (codes[i] >= set.entries.size()) throw UnknownEnumVersionException();
        values[i] = set.entries[codes[i]].value;
    }
}

void EnumSerialiser::DecodeFromSerial(unsigned short const* codes, u64 count, unsigned short version, int* values,
                                      u64 capacity) const
{
    DecodeFromSerial(codes, std::min(count, capacity), version, values);
}

} // namespace Kernel
