#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/SharedSerialisable.h"

#include <algorithm>
#include <unordered_set>

// The canonical copies of a shared class lie in a hash set that owns them, so a copy is held by nobody else exactly
// when its count is 1, and while the set's lock is held nobody can come to hold it. Sweeping happens every time the set
// has grown by a quarter, so its cost is spread over the objects that were added.

namespace Kernel {

namespace {

constexpr u64 c_firstSweepThreshold = 32;

struct HashByValue
{
    size_t operator()(Counted<SharedSerialisable> const& object) const { return object->GenerateHash(); }
};

struct EqualByValue
{
    bool operator()(Counted<SharedSerialisable> const& a, Counted<SharedSerialisable> const& b) const
    {
        return a->Equals(Counted<SharedSerialisable const>(b));
    }
};

using ObjectSet = std::unordered_set<Counted<SharedSerialisable>, HashByValue, EqualByValue>;

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
    auto const [place, isNew] = m_set->objects.insert(WithoutConst(object));
    // Taken before the sweep, which moves everything to another set.
    Result const result = Result::Trust(*place);
    if (!isNew) return result;
    object->m_isConsolidated.store(true, std::memory_order_release);
    object->OnConsolidated();
    if (m_set->objects.size() >= m_set->sweepThreshold) SweepOnceI();
    return result;
}

Consolidated<SharedSerialisable>
SharedClassProperties::FindConsolidatedObject(Counted<SharedSerialisable const> const& object) const
{
    using Result = Consolidated<SharedSerialisable>;
    if (!object) return {};
    if (object->IsConsolidated()) return Result::Trust(WithoutConst(object));
    LockScope const scope(m_set->lock);
    auto const found = m_set->objects.find(WithoutConst(object));
    return found == m_set->objects.end() ? Result() : Result::Trust(*found);
}

bool SharedClassProperties::SweepOnceI() const
{
    ObjectSet kept;
    {
        LockScope const scope(m_set->lock);
        ObjectSet& objects = m_set->objects;
        kept.max_load_factor(objects.max_load_factor());
        kept.reserve(objects.size());
        for (auto place = objects.begin(); place != objects.end();) {
            auto const next = std::next(place);
            if ((*place)->GetReferenceCount() > 1) kept.insert(objects.extract(place));
            place = next;
        }
        objects.swap(kept);
        m_set->sweepThreshold = objects.size() + std::max<u64>(objects.size() / 4, c_firstSweepThreshold);
    }
    // What nobody holds dies here, outside the lock if this thread took it only for the sweep.
    return !kept.empty();
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
