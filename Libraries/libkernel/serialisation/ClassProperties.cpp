#include "libkernel/serialisation/ClassProperties.h"

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Assert.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/serialisation/internal/DefaultTable.h"

namespace Kernel {

namespace {

using Registry = std::map<ClassUID, ClassPropertiesBase const*>;

// Made by the first registration, which may come from any static initialiser.
Registry& GetRegistry()
{
    static Registry registry;
    return registry;
}

} // namespace

ClassPropertiesBase::Init::Init(ClassPropertiesBase const* description)
{
    // In every build: a program with two classes of one code would read one class's files as the other's.
    if (!description) FailAssertion(__FILE__, "a class description is registered", __LINE__);
    bool const isNew = GetRegistry().emplace(description->GetClassUID(), description).second;
    if (!isNew) FailAssertion(__FILE__, "a class code is registered once", __LINE__);
}

ClassPropertiesBase::ClassPropertiesBase(ClassUID const& classUID, unsigned short schemaVersion)
    : ClassPropertiesBase(classUID, schemaVersion, nullptr, nullptr)
{
}

ClassPropertiesBase::ClassPropertiesBase(ClassUID const& classUID, unsigned short schemaVersion,
                                         DefaultItem const* defaults, ClassPropertiesBase const* parent)
    : m_classUID(classUID), m_parent(parent), m_schemaVersion(schemaVersion)
{
    for (; defaults && *defaults; ++defaults) m_defaults.insert_or_assign((*defaults)->GetIDTag(), *defaults);
}

ClassPropertiesBase::~ClassPropertiesBase()
{
    delete m_table.load(std::memory_order_acquire);
}

bool ClassPropertiesBase::IsPolymorphicType(ClassUID classUID) const
{
    for (auto const* level = this; level; level = level->m_parent)
        if (level->m_classUID == classUID) return true;
    return false;
}

ClassPropertiesBase const* ClassPropertiesBase::FindClassPropertiesBase(ClassUID const& classUID)
{
    Registry const& registry = GetRegistry();
    auto const found = registry.find(classUID);
    return found == registry.end() ? nullptr : found->second;
}

void ClassPropertiesBase::InternalFailure(char const* file, int line)
{
    throw OutSerialiser::SaveException(file, line, OutSerialiser::SaveException::Misuse);
}

template <class T>
T const* ClassPropertiesBase::FindDefaultI(IDTag tag) const
{
    auto const found = m_defaults.find(tag);
    if (found == m_defaults.end() || found->second->GetDefaultType() != T::c_kind) return nullptr;
    return static_cast<T const*>(found->second.Get());
}

bool ClassPropertiesBase::TestDefaultType(IDTag tag, PropType type, void const* value, u64 size) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultType>(tag);
    return item && item->Compare(type, value, size);
}

bool ClassPropertiesBase::TestDefaultType(IDTag tag, String8 const& text) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultString>(tag);
    return item && item->Compare(text);
}

bool ClassPropertiesBase::TestDefaultTypeArray(IDTag tag, PropType type, void const* values, u64 unitSize,
                                               u64 count) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultTypeArray>(tag);
    return item && item->Compare(type, values, unitSize, count);
}

bool ClassPropertiesBase::TestDefaultTypeArray(IDTag tag, bool const* values, u64 count) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultTypeArray>(tag);
    return item && item->Compare(values, count);
}

bool ClassPropertiesBase::TestDefaultTypeArray(IDTag tag, std::vector<bool> const& values) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultTypeArray>(tag);
    return item && item->Compare(values);
}

bool ClassPropertiesBase::TestDefaultStringArray(IDTag tag, String8 const* texts, u64 count) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultStringArray>(tag);
    return item && item->Compare(texts, count);
}

bool ClassPropertiesBase::TestDefaultCustom(IDTag tag, void const* value, u64 size) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultCustom>(tag);
    return item && item->Compare(value, size);
}

bool ClassPropertiesBase::TestDefaultCustomArray(IDTag tag, void const* values, u64 unitSize, u64 count) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultCustomArray>(tag);
    return item && item->Compare(values, unitSize, count);
}

bool ClassPropertiesBase::TestDefaultEnum(IDTag tag, unsigned short code, unsigned short version) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultEnum>(tag);
    return item && item->Compare(code, version);
}

bool ClassPropertiesBase::TestDefaultEnumArray(IDTag tag, unsigned short const* codes, u64 count,
                                               unsigned short version) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultEnumArray>(tag);
    return item && item->Compare(codes, count, version);
}

bool ClassPropertiesBase::TestDefaultFlagSet(IDTag tag, u64 encoded, unsigned short version) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultFlagSet>(tag);
    return item && item->Compare(encoded, version);
}

bool ClassPropertiesBase::TestDefaultSharedObject(IDTag tag, Consolidated<SharedSerialisable> const& object) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultSharedObject>(tag);
    return item && item->Compare(object);
}

bool ClassPropertiesBase::TestDefaultSharedObjectArray(
    IDTag tag, std::vector<Consolidated<SharedSerialisable>> const& objects) const
{
    auto const* const item = FindDefaultI<Defaults::DefaultSharedObjectArray>(tag);
    return item && item->Compare(objects);
}

DefaultTable const& ClassPropertiesBase::GetDefaultTable() const
{
    DefaultTable const* table = m_table.load(std::memory_order_acquire);
    if (table) return *table;
    // Two threads may both make it; the tables are equal and the second is dropped.
    auto made = std::make_unique<DefaultTable const>(*this);
    if (m_table.compare_exchange_strong(table, made.get(), std::memory_order_acq_rel)) return *made.release();
    return *table;
}

void ClassPropertiesBase::ClearDefaults()
{
    m_defaults.clear();
    delete m_table.exchange(nullptr, std::memory_order_acq_rel);
}

void ShutdownSerialisation()
{
    // The descriptions are const to everybody else; this is the one change in their life.
    for (auto const& [classUID, description] : GetRegistry())
        const_cast<ClassPropertiesBase*>(description)->ClearDefaults();
}

ClassProperties::ClassProperties(ClassUID const& classUID, CreateLegacyFunc create, unsigned short schemaVersion)
    : ClassPropertiesBase(classUID, schemaVersion), m_create(nullptr), m_createLegacy(create)
{
}

ClassProperties::ClassProperties(ClassUID const& classUID, CreateFunc create, unsigned short schemaVersion,
                                 DefaultItem const* defaults, ClassPropertiesBase const* parent)
    : ClassPropertiesBase(classUID, schemaVersion, defaults, parent), m_create(create), m_createLegacy(nullptr)
{
}

ClassProperties::~ClassProperties() = default;

bool ClassProperties::IsSharedType() const
{
    return false;
}

bool ClassProperties::IsLegacy() const
{
    return m_createLegacy != nullptr;
}

} // namespace Kernel
