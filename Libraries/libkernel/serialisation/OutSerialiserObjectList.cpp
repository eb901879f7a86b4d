#include "libkernel/serialisation/OutSerialiserObjectList.h"

#include <algorithm>
#include <functional>

namespace Kernel {

OutSerialiserObjectList::OutSerialiserObjectList() = default;
OutSerialiserObjectList::~OutSerialiserObjectList() = default;

// The object's record, or the free one where it belongs. Objects lie at multiples of 16 and often in a row: the
// product's upper half spreads them.
OutSerialiserObjectList::Record* OutSerialiserObjectList::Map::Probe(void const* object) const
{
    u64 const mixed = reinterpret_cast<std::uintptr_t>(object) * 0x9E3779B97F4A7C15ull;
    u32 place = static_cast<u32>(mixed >> 32) & (size - 1);
    while (records[place].object && records[place].object != object) place = (place + 1) & (size - 1);
    return &records[place];
}

void OutSerialiserObjectList::Map::Grow()
{
    Map larger;
    larger.size = size ? size * 2 : c_firstSize;
    larger.used = used;
    larger.records = std::make_unique<Record[]>(larger.size);
    for (u32 i = 0; i < size; ++i)
        if (records[i].object) *larger.Probe(records[i].object) = records[i];
    *this = std::move(larger);
}

OutSerialiserObjectList::Record& OutSerialiserObjectList::FindOrAddI(Map& map, void const* object, bool& isNew)
{
    if (map.used >= map.size / 4 * 3) map.Grow();
    Record& record = *map.Probe(object);
    isNew = !record.object;
    ++record.references;
    if (!isNew) return record;
    ++map.used;
    record.object = object;
    record.index = m_nextIndex++;
    return record;
}

OutSerialiserObjectList::Record* OutSerialiserObjectList::FindShared(void const* object)
{
    if (!m_sharedObjects.size) return nullptr;
    Record* const record = m_sharedObjects.Probe(object);
    return record->object ? record : nullptr;
}

bool OutSerialiserObjectList::IsDescribed(ClassPropertiesBase const* description) const
{
    if (description == m_lastDescribed) return true;
    if (!std::ranges::binary_search(m_described, description, std::less<>())) return false;
    m_lastDescribed = description;
    return true;
}

void OutSerialiserObjectList::MarkAsDescribed(ClassPropertiesBase const* description)
{
    auto const place = std::ranges::lower_bound(m_described, description, std::less<>());
    if (place == m_described.end() || *place != description) m_described.insert(place, description);
}

} // namespace Kernel
