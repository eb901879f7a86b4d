#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"
#include "libkernel/serialisation/OutSerialiserStep.h"

#include <array>
#include <map>
#include <memory>
#include <span>
#include <vector>

namespace Kernel {

class ClassPropertiesBase;
class DefaultTable;

/// What one save knows of a class.
struct OutSerialiserClass
{
    static constexpr u32 c_maxSequences = 4;

    ClassPropertiesBase const* description = nullptr;
    DefaultTable const* defaults = nullptr; ///< Of the class and its parents; null if there are none.
    bool isDescribed = false;
    /// The tags that an object of the class saved, in its order, or null. Objects that are being saved go by older
    /// sequences, so these live on too.
    OutSerialiserStep const* steps = nullptr;
    std::array<std::unique_ptr<OutSerialiserStep[]>, c_maxSequences> sequences;
    u32 sequenceCount = 0;
};

/// The state of one save, shared by all its nested serialisers: which objects were written under which index, and which
/// classes were described. Objects are told apart by address, so each must live until the save ends. Belongs to the
/// thread of the save.
class KERNEL_API OutSerialiserObjectList
{
public:
    struct Record
    {
        void const* object;
        u32 references : 30;
        u32 isOwned : 1;   ///< Some owner saved the object.
        u32 isWriting : 1; ///< The object is being written: it lies in the set that stops a cycle.
    };

    OutSerialiserObjectList();
    OutSerialiserObjectList(OutSerialiserObjectList const&) = delete;
    OutSerialiserObjectList& operator=(OutSerialiserObjectList const&) = delete;
    ~OutSerialiserObjectList();

    /// The object's record, entered with the next index if there was none; then @p isNew is true. The reference stays
    /// good. Plain and shared objects have a map each and one counter of indices.
    Record& FindOrAdd(void const* object, u32& index, bool& isNew)
    {
        return FindOrAddI(m_objects, object, index, isNew);
    }
    Record& FindOrAddShared(void const* object, u32& index, bool& isNew)
    {
        return FindOrAddI(m_sharedObjects, object, index, isNew);
    }

    /// A plain object is asked for soon.
    void Prefetch(void const* object) const
    {
        if (m_objects.size) __builtin_prefetch(&m_objects.slots[GetHash(object) & (m_objects.size - 1)]);
    }

    /// What is known of a class; made at the first question, and stays good.
    OutSerialiserClass& GetClass(ClassPropertiesBase const& description)
    {
        return m_lastClass && m_lastClass->description == &description ? *m_lastClass : FindClass(description);
    }
    /// Notes in which order an object of the class has saved its tags, all different; the next objects are expected to
    /// do the same. A class whose objects keep no order stays as it is after a few attempts.
    static void Learn(OutSerialiserClass& known, std::span<u32 const> tags);

    /// A save that failed writes nothing more, so that what is destroyed on the way out does no harm.
    void MarkAsHandlingException() { m_isHandlingException = true; }
    bool IsHandlingException() const { return m_isHandlingException; }

    /// Keeps an object alive until the save ends.
    void KeepAlive(Counted<Countable const> const& object) { m_keptAlive.push_back(object); }

private:
    // Open addressing with linear probing; the size is a power of two and a quarter is always free. The hash is kept,
    // so that a look-up goes to the records only for the object itself.
    struct Slot
    {
        u32 hash;
        u32 place; // Index plus 1; 0 is a free slot.
    };
    struct Map
    {
        static constexpr u32 c_firstSize = 64;
        std::unique_ptr<Slot[]> slots;
        u32 size = 0;
        u32 used = 0;

        void Grow();
    };
    // Records lie in pieces in the order of their indices: they never move, and pieces of this size come back warm from
    // the save before.
    static constexpr u32 c_pieceSize = 256;

    // Objects lie at multiples of 16. Neighbours within a page stay neighbours, since objects that were made together
    // are often saved together; pages are spread.
    static u32 GetHash(void const* object)
    {
        u64 const address = reinterpret_cast<std::uintptr_t>(object);
        u64 const page = (address >> 12) * 0x9E3779B97F4A7C15ull;
        return static_cast<u32>(page >> 32) + static_cast<u32>(address >> 4 & 0xFF);
    }
    OutSerialiserClass& FindClass(ClassPropertiesBase const& description);
    Record& FindOrAddI(Map& map, void const* object, u32& index, bool& isNew);
    Record& GetRecord(u32 index) const { return m_records[index / c_pieceSize][index % c_pieceSize]; }

    Map m_objects;
    Map m_sharedObjects;
    std::vector<std::unique_ptr<Record[]>> m_records;
    u32 m_nextIndex = 0;
    bool m_isHandlingException = false;
    std::map<ClassPropertiesBase const*, OutSerialiserClass> m_classes;
    OutSerialiserClass* m_lastClass = nullptr; // Asked for last: objects of one class come in runs.
    std::vector<Counted<Countable const>> m_keptAlive;
};

inline OutSerialiserObjectList::Record& OutSerialiserObjectList::FindOrAddI(Map& map, void const* object, u32& index,
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

} // namespace Kernel
