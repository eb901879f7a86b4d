#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Export.h"
#include "libkernel/core/Types.h"

#include <memory>
#include <vector>

namespace Kernel {

class ClassPropertiesBase;

/// The state of one save, shared by all its nested serialisers: which objects were written under which index, and which
/// classes were described. Objects are told apart by address, so each must live until the save ends. Belongs to the
/// thread of the save.
class KERNEL_API OutSerialiserObjectList
{
public:
    struct Record
    {
        void const* object = nullptr;
        u32 index = 0;
        u32 references : 30 = 0;
        u32 isOwned : 1 = 0;   ///< Some owner saved the object.
        u32 isWriting : 1 = 0; ///< The object is being written: it lies in the set that stops a cycle.
    };

    OutSerialiserObjectList();
    OutSerialiserObjectList(OutSerialiserObjectList const&) = delete;
    OutSerialiserObjectList& operator=(OutSerialiserObjectList const&) = delete;
    ~OutSerialiserObjectList();

    /// The object's record, entered with the next index if there was none; then @p isNew is true. The reference is good
    /// until the next call. Plain and shared objects have a map each and one counter of indices.
    Record& FindOrAdd(void const* object, bool& isNew) { return FindOrAddI(m_objects, object, isNew); }
    Record& FindOrAddShared(void const* object, bool& isNew) { return FindOrAddI(m_sharedObjects, object, isNew); }
    Record* FindShared(void const* object);

    bool IsDescribed(ClassPropertiesBase const* description) const;
    void MarkAsDescribed(ClassPropertiesBase const* description);

    /// A save that failed writes nothing more, so that what is destroyed on the way out does no harm.
    void MarkAsHandlingException() { m_isHandlingException = true; }
    bool IsHandlingException() const { return m_isHandlingException; }

    /// Keeps an object alive until the save ends.
    void KeepAlive(Counted<Countable const> const& object) { m_keptAlive.push_back(object); }

private:
    // Open addressing with linear probing; the size is a power of two and more than a quarter is always free.
    struct Map
    {
        static constexpr u32 c_firstSize = 32;
        std::unique_ptr<Record[]> records;
        u32 size = 0;
        u32 used = 0;

        Record* Probe(void const* object) const;
        void Grow();
    };
    Record& FindOrAddI(Map& map, void const* object, bool& isNew);

    Map m_objects;
    Map m_sharedObjects;
    u32 m_nextIndex = 0;
    bool m_isHandlingException = false;
    mutable ClassPropertiesBase const* m_lastDescribed = nullptr; // Of the last successful question.
    std::vector<ClassPropertiesBase const*> m_described;          // Sorted by address.
    std::vector<Counted<Countable const>> m_keptAlive;
};

} // namespace Kernel
