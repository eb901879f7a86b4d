#include "libkernel/serialisation/OutSerialiserObjectList.h"

#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/internal/DefaultTable.h"

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

OutSerialiserClass& OutSerialiserObjectList::FindClass(ClassPropertiesBase const& description)
{
    auto const [at, isNew] = m_classes.try_emplace(&description);
    OutSerialiserClass& known = at->second;
    if (isNew) {
        known.description = &description;
        DefaultTable const& defaults = description.GetDefaultTable();
        if (!defaults.IsEmpty()) known.defaults = &defaults;
    }
    m_lastClass = &known;
    return known;
}

void OutSerialiserObjectList::Learn(OutSerialiserClass& known, std::span<u32 const> tags)
{
    if (tags.empty() || known.sequenceCount == OutSerialiserClass::c_maxSequences) return;
    auto steps = std::make_unique<OutSerialiserStep[]>(tags.size() + 1);
    for (size_t i = 0; i < tags.size(); ++i) {
        DefaultRow const* const row = known.defaults ? known.defaults->Find(IDTag(tags[i])) : nullptr;
        steps[i] = {tags[i], 0, PropType::EndOfList, row};
        if (row && row->size) steps[i].type = row->type, steps[i].value = row->value;
    }
    known.steps = steps.get();
    known.sequences[known.sequenceCount++] = std::move(steps);
}

} // namespace Kernel
