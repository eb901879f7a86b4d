#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Hash.h"
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/CompareContext.h"
#include "libkernel/serialisation/SharedSerialisable.h"

#include <algorithm>
#include <vector>

// The canonical copies of a shared class lie in a hash set that owns them, so a copy is held by nobody else exactly
// when its count is 1, and while the set's lock is held nobody can come to hold it. Sweeping happens every time the set
// has grown by a quarter, so its cost is spread over the objects that were added.
//
// The values come from files, and whoever makes a file can make values of one GenerateHash. So the set hashes with a
// seed of this process, and keeps chains, in which objects that hash alike all the same cost one comparison each but
// nothing more, neither when a sweep builds the set anew.

namespace Kernel {

namespace {

constexpr u64 c_firstSweepThreshold = 32;

class ObjectSet
{
public:
    u64 GetCount() const { return m_entries.size(); }

    /// The equal object, or null.
    SharedSerialisable* Find(SharedSerialisable const& object) const { return FindI(object, Hash(object)); }

    /// The equal object that was there, or @p object, which is then in the set.
    SharedSerialisable* FindOrAdd(Counted<SharedSerialisable> const& object)
    {
        u32 const hash = Hash(*object);
        if (SharedSerialisable* const found = FindI(*object, hash)) return found;
        if (m_entries.size() == m_heads.size()) Rebuild(std::max<u64>(m_heads.size() * 2, c_firstHeads));
        m_entries.push_back({hash, 0, object});
        Link(m_entries.size() - 1);
        return object.Get();
    }

    /// Takes out what nobody else holds.
    std::vector<Counted<SharedSerialisable>> TakeUnheld()
    {
        std::vector<Counted<SharedSerialisable>> unheld;
        std::vector<Entry> kept;
        for (Entry& entry : m_entries) {
            if (entry.object->GetReferenceCount() > 1)
                kept.push_back(std::move(entry));
            else
                unheld.push_back(std::move(entry.object));
        }
        m_entries = std::move(kept);
        Rebuild(m_heads.size());
        return unheld;
    }

private:
    struct Entry
    {
        u32 hash;
        u32 next; // Place in m_entries plus 1; 0 ends the chain.
        Counted<SharedSerialisable> object;
    };
    static constexpr u64 c_firstHeads = 32;

    static u32 Hash(SharedSerialisable const& object)
    {
        // Where the library was loaded is not known outside.
        static u32 const seed = static_cast<u32>(HashConstVoidStar(&seed));
        HashAccumulator hash(seed);
        object.AccumulateHash(hash);
        return hash.GetHash();
    }
    SharedSerialisable* FindI(SharedSerialisable const& object, u32 hash) const
    {
        if (m_heads.empty()) return nullptr;
        CompareContext const context;
        for (u32 at = m_heads[hash & (m_heads.size() - 1)]; at; at = m_entries[at - 1].next) {
            Entry const& entry = m_entries[at - 1];
            // Objects of one set have one description, so members are all there is to compare.
            if (entry.hash == hash && entry.object->CompareMembers(object, context)) return entry.object.Get();
        }
        return nullptr;
    }
    void Link(u64 place)
    {
        u32& head = m_heads[m_entries[place].hash & (m_heads.size() - 1)];
        m_entries[place].next = head;
        head = static_cast<u32>(place + 1);
    }
    void Rebuild(u64 heads)
    {
        m_heads.assign(heads, 0);
        for (u64 i = 0; i < m_entries.size(); ++i) Link(i);
    }

    std::vector<Entry> m_entries;
    std::vector<u32> m_heads; // A power of two, or none.
};

struct SharedClassList
{
    CriticalSectionSpin lock; // Taken before the lock of any class.
    std::vector<SharedClassProperties const*> classes;
};

SharedClassList& GetSharedClassList()
{
    static SharedClassList list;
    return list;
}

// The set's objects are not const, since a Counted of a const object could not be given out as Consolidated.
Counted<SharedSerialisable> WithoutConst(Counted<SharedSerialisable const> const& object)
{
    return Counted<SharedSerialisable>(const_cast<SharedSerialisable*>(object.Get()));
}

} // namespace

struct SharedClassProperties::CanonicalSet
{
    CriticalSection lock;
    u64 sweepThreshold = c_firstSweepThreshold;
    ObjectSet objects;
};

SharedClassProperties::SharedClassProperties(ClassUID const& classUID, CreateLegacyFunc create,
                                             unsigned short schemaVersion)
    : ClassPropertiesBase(classUID, schemaVersion), m_create(nullptr), m_createLegacy(create),
      m_set(std::make_unique<CanonicalSet>())
{
    SharedClassList& list = GetSharedClassList();
    LockScope const scope(list.lock);
    list.classes.push_back(this);
}

SharedClassProperties::SharedClassProperties(ClassUID const& classUID, CreateFunc create, unsigned short schemaVersion,
                                             DefaultItem const* defaults, ClassPropertiesBase const* parent)
    : ClassPropertiesBase(classUID, schemaVersion, defaults, parent), m_create(create), m_createLegacy(nullptr),
      m_set(std::make_unique<CanonicalSet>())
{
    SharedClassList& list = GetSharedClassList();
    LockScope const scope(list.lock);
    list.classes.push_back(this);
}

SharedClassProperties::~SharedClassProperties()
{
    SharedClassList& list = GetSharedClassList();
    LockScope const scope(list.lock);
    std::erase(list.classes, this);
}

bool SharedClassProperties::IsSharedType() const
{
    return true;
}

bool SharedClassProperties::IsLegacy() const
{
    return m_createLegacy != nullptr;
}

Consolidated<SharedSerialisable>
SharedClassProperties::ConsolidateObjectSacrifice(Counted<SharedSerialisable const> const& object) const
{
    using Result = Consolidated<SharedSerialisable>;
    if (!object) return {};
    if (object->IsConsolidated()) return Result::Trust(WithoutConst(object));
    LockScope const scope(m_set->lock);
    Result const result = Result::Trust(m_set->objects.FindOrAdd(WithoutConst(object)));
    if (result.Get() != object.Get()) return result;
    object->m_isConsolidated.store(true, std::memory_order_release);
    object->OnConsolidated();
    if (m_set->objects.GetCount() >= m_set->sweepThreshold) SweepOnceI();
    return result;
}

Consolidated<SharedSerialisable>
SharedClassProperties::FindConsolidatedObject(Counted<SharedSerialisable const> const& object) const
{
    using Result = Consolidated<SharedSerialisable>;
    if (!object) return {};
    if (object->IsConsolidated()) return Result::Trust(WithoutConst(object));
    LockScope const scope(m_set->lock);
    return Result::Trust(m_set->objects.Find(*object));
}

bool SharedClassProperties::SweepOnceI() const
{
    std::vector<Counted<SharedSerialisable>> unheld;
    {
        LockScope const scope(m_set->lock);
        unheld = m_set->objects.TakeUnheld();
        u64 const count = m_set->objects.GetCount();
        m_set->sweepThreshold = count + std::max<u64>(count / 4, c_firstSweepThreshold);
    }
    // What nobody holds dies here, outside the lock if this thread took it only for the sweep.
    return !unheld.empty();
}

void SharedClassProperties::Sweep(bool untilStable) const
{
    while (SweepOnceI() && untilStable) {
    }
}

void SharedClassProperties::SweepAll(bool untilStable)
{
    SharedClassList const& list = GetSharedClassList();
    LockScope const scope(list.lock);
    bool isStable;
    do {
        isStable = true;
        for (SharedClassProperties const* const description : list.classes) isStable &= !description->SweepOnceI();
    } while (untilStable && !isStable);
}

} // namespace Kernel
