#include "libkernel/serialisation/OutSerialiserObjectList.h"

#include <algorithm>
#include <functional>

namespace Kernel {

OutSerialiserObjectList::OutSerialiserObjectList() = default;
OutSerialiserObjectList::~OutSerialiserObjectList() = default;

void OutSerialiserObjectList::Map::Grow()
{
    Map larger;
    larger.size = size ? size * 4 : c_firstSize;
    larger.used = used;
    larger.slots = std::make_unique<Slot[]>(larger.size);
    for (u32 i = 0; i < size; ++i) {
        if (!slots[i].place) continue;
        u32 at = slots[i].hash & (larger.size - 1);
        while (larger.slots[at].place) at = (at + 1) & (larger.size - 1);
        larger.slots[at] = slots[i];
    }
    *this = std::move(larger);
}

OutSerialiserObjectList::Record& OutSerialiserObjectList::FindOrAddI(Map& map, void const* object, u32& index,
                                                                     bool& isNew)
{
    if (map.used >= map.size / 4 * 3) map.Grow();
    u32 const hash = GetHash(object);
    u32 const mask = map.size - 1;
    u32 at = hash & mask;
    for (; map.slots[at].place; at = (at + 1) & mask) {
        if (map.slots[at].hash != hash) continue;
        index = map.slots[at].place - 1;
        Record& record = GetRecord(index);
        if (record.object != object) continue;
        ++record.references;
        isNew = false;
        return record;
    }
    ++map.used;
    index = m_nextIndex++;
    map.slots[at] = {hash, index + 1};
    if (index % c_pieceSize == 0) m_records.push_back(std::make_unique_for_overwrite<Record[]>(c_pieceSize));
    isNew = true;
    Record& record = GetRecord(index);
    record = {object, 1, 0, 0};
    return record;
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
