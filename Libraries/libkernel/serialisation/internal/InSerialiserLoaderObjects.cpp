#include "libkernel/core/Format.h"
#include "libkernel/core/Trace.h"
#include "libkernel/filestore/FileStore.h"
#include "libkernel/serialisation/FutureVersionException.h"
#include "libkernel/serialisation/internal/InSerialiserLoader.h"
#include "libkernel/serialisation/internal/TagText.h"

#include <algorithm>

namespace Kernel {

namespace {

[[noreturn]] void RefuseObject(ClassUID uid)
{
    Trace(FormatT<String8>(">>> Failed to load object: %1\n", TagText(uid)));
    throw FutureVersionException(true);
}

// What the file says about a class's parent against what the program says. Diagnostics only.
void TraceParent(ClassPropertiesBase const& properties, ClassPropertiesBase const* found, bool isUnknown)
{
    if (properties.IsLegacy()) return;
    String8 const uid = TagText(properties.GetClassUID());
    ClassPropertiesBase const* const expected = properties.GetParentClassProperties();
    if (!expected && isUnknown)
        Trace(FormatT<String8>(">>> Unexpected parent class for %1:  Unknown (see above)\n", uid));
    else if (!expected && found)
        Trace(FormatT<String8>(">>> Unexpected parent class for %1:  Found %2\n", uid, TagText(found->GetClassUID())));
    else if (expected && isUnknown)
        Trace(
            FormatT<String8>(">>> Missing parent class for %1:  Expected %2\n", uid, TagText(expected->GetClassUID())));
    else if (expected && found && found != expected)
        Trace(FormatT<String8>(">>> Incorrect parent class for %1:  Found %2  Expected %3\n", uid,
                               TagText(found->GetClassUID()), TagText(expected->GetClassUID())));
}

} // namespace

// The list of one object, for as long as its Load runs. What it holds goes when the scope ends, so that nobody who kept
// the list can follow it onto the stack; the list itself serves the next object of this depth unless somebody did.
class InSerialiserLoader::ObjectList
{
public:
    ObjectList(InSerialiserLoader& loader, InSerialiserClassInfoBase const& info)
        : m_loader(loader), m_base(loader.m_stack.size())
    {
        if (loader.m_listsInUse == loader.m_lists.size()) loader.m_lists.emplace_back();
        Counted<InSerialiser>& list = loader.m_lists[loader.m_listsInUse];
        if (!list || list->GetReferenceCount() > 1) list = loader.MakeList();
        m_list = list.Get();
        m_list->m_classInfo = &info;
        ++loader.m_listsInUse;
    }
    ~ObjectList()
    {
        m_list->TearDownAllProperties();
        m_list->m_classInfo = nullptr;
        if (m_isParsed) m_loader.m_stack.resize(m_base);
        --m_loader.m_listsInUse;
    }
    ObjectList(ObjectList const&) = delete;
    ObjectList& operator=(ObjectList const&) = delete;

    bool Parse() { return m_isParsed = m_loader.ParseOnStack(*m_list); }
    InSerialiser& operator*() const { return *m_list; }

private:
    InSerialiserLoader& m_loader;
    InSerialiser* m_list; // Held by the loader.
    size_t const m_base;
    bool m_isParsed = false; // The stretch of the stack from m_base on is the list's.
};

bool InSerialiserLoader::ReportProgress()
{
    if (!m_progress || m_progress(m_source.GetProgress())) return true;
    SetAborted();
    return false;
}

void InSerialiserLoader::ReportObjects(InSerialiserFile::EndFunc const& end) const
{
    std::vector<NonCounted<Serialisable>> dropped;
    std::vector<NonCounted<Serialisable>> others;
    auto const sort = [&](ObjectRecord const& record) {
        if (record.kind != InSerialiserProperty::Type::Object) return;
        bool const isDropped = record.object->GetReferenceCount() == 1 && m_markers->WasLoaded(record.object);
        (isDropped ? dropped : others).push_back(record.object);
    };
    std::for_each(m_objects.begin(), m_objects.end(), sort);
    for (auto const& [index, record] : m_strayObjects) sort(record);
    if (!dropped.empty()) end(dropped, others);
}

// Objects.

InSerialiserLoader::ObjectRecord const* InSerialiserLoader::FindObject(u32 index) const
{
    if (index < m_objects.size() && m_objects[index].kind != InSerialiserProperty::Type::None) return &m_objects[index];
    if (m_strayObjects.empty()) return nullptr;
    auto const at = m_strayObjects.find(index);
    return at == m_strayObjects.end() ? nullptr : &at->second;
}

// From here on the parse owns the object, and every property that it stands in only borrows it.
bool InSerialiserLoader::AddObject(u32 index, InSerialiserProperty& property, Counted<Serialisable> object)
{
    ObjectRecord* const record = AddRecord(index);
    if (!record) return false;
    record->kind = property.kind = InSerialiserProperty::Type::Object;
    record->object = property.object = object.Detach();
    return true;
}

InSerialiserLoader::ObjectRecord* InSerialiserLoader::AddRecord(u32 index)
{
    ObjectRecord* record = nullptr;
    if (index == m_objects.size() && index < m_objectsBegun && m_strayObjects.empty())
        record = &m_objects.emplace_back(); // The usual case.
    else if (FindObject(index))
        return nullptr;
    else if (index >= m_objectsBegun)
        record = &m_strayObjects[index];
    else {
        if (index >= m_objects.size()) m_objects.resize(index + size_t(1));
        record = &m_objects[index];
    }
    record->ownsObjects = true;
    return record;
}

bool InSerialiserLoader::ParseObject(InSerialiserProperty& property)
{
    return ReadObject(property);
}

bool InSerialiserLoader::ReadObject(InSerialiserProperty& property)
{
    u8 first = 0;
    u32 index = 0;
    if (!m_source.ReadNumber(first)) return false;
    switch (static_cast<Kernel::ObjectRecord>(first)) {
    case Kernel::ObjectRecord::Null: property.kind = InSerialiserProperty::Type::NullObject; return true;
    case Kernel::ObjectRecord::First: return ReadNewObject(property);
    case Kernel::ObjectRecord::Back: break;
    default: return false;
    }
    if (!m_source.ReadNumber(index)) return false;
    ObjectRecord const* const record = FindObject(index);
    if (!record) return false;
    property.kind = record->kind;
    property.object = record->object;
    return true;
}

bool InSerialiserLoader::ReadNewObject(InSerialiserProperty& property)
{
    NestingGuard const level;
    u32 index = 0;
    if (!level.IsAllowed() || !m_source.ReadNumber(index) || FindObject(index)) return false;
    ++m_objectsBegun;
    ClassResult result;
    if (!ReportProgress() || !ReadClassRecord(result)) return false;
    if (result.isUnknown) {
        property.kind = InSerialiserProperty::Type::NullObject;
        m_source.OpenList();
        if (!SkipProperties()) return false;
        m_source.CloseList();
        return true;
    }
    if (!result.info) return false;
    InSerialiserDataPool::Mark const mark = m_pool->GetMark();
    InSerialiserClassInfoBase const& info = *result.info;
    if (!(info.GetProperties().IsSharedType() ? CreateShared(index, info, property)
                                              : CreatePlain(index, info, property)))
        return false;
    if (m_defaultsNesting == 0) m_pool->GiveBack(mark);
    return true;
}

bool InSerialiserLoader::CreatePlain(u32 index, InSerialiserClassInfoBase const& info, InSerialiserProperty& property)
{
    auto const& properties = static_cast<ClassProperties const&>(info.GetProperties());
    if (auto const create = properties.GetCreateFunc()) {
        // In the map before its properties are read, so that they can refer to it.
        Counted<Serialisable> object = create();
        if (!object || !AddObject(index, property, std::move(object))) return false;
        ObjectList list(*this, info);
        if (!list.Parse()) return false;
        if (!property.object->Load(*list, m_store, info.GetVersion())) RefuseObject(properties.GetClassUID());
        return true;
    }
    auto const createLegacy = properties.GetCreateLegacyFunc();
    if (!createLegacy) return false;
    ObjectList list(*this, info);
    if (!list.Parse()) return false;
    Counted<Serialisable> object = createLegacy(*list, info.GetVersion());
    if (!object) return false;
    if (!object->Load(*list, m_store, info.GetVersion())) RefuseObject(properties.GetClassUID());
    return AddObject(index, property, std::move(object));
}

bool InSerialiserLoader::CreateShared(u32 index, InSerialiserClassInfoBase const& info, InSerialiserProperty& property)
{
    auto const& properties = static_cast<SharedClassProperties const&>(info.GetProperties());
    Counted<SharedSerialisable> object;
    {
        ObjectList list(*this, info);
        if (!list.Parse()) return false;
        if (auto const create = properties.GetCreateFunc())
            object = create();
        else if (auto const createLegacy = properties.GetCreateLegacyFunc())
            object = createLegacy(*list, info.GetVersion());
        if (!object) return false;
        if (!object->Load(*list, m_store, info.GetVersion())) RefuseObject(properties.GetClassUID());
    }
    Consolidated<SharedSerialisable> const canonical = properties.ConsolidateObjectSacrifice(object);
    ObjectRecord* const record = AddRecord(index);
    if (!record) return false;
    record->kind = property.kind = InSerialiserProperty::Type::SharedObject;
    record->shared = property.shared = Counted<SharedSerialisable>(canonical.GetCounted()).Detach();
    return true;
}

bool InSerialiserLoader::StoreObjects(InSerialiserProperty& property, InSerialiserProperty::Type kind, u32 count,
                                      size_t base)
{
    u8* const at = GetPool().Allocate(sizeof(StoredObjects) + count * sizeof(void*));
    if (!at) return false;
    property.objects = new (at) StoredObjects{count};
    // The stack begins at the first object that is not null.
    size_t const nulls = count - (m_stack.size() - base);
    auto const fill = [&](auto** objects, auto pointer) {
        std::fill_n(objects, nulls, nullptr);
        for (size_t i = nulls; i < count; ++i) objects[i] = m_stack[base + i - nulls].*pointer;
    };
    if (kind == InSerialiserProperty::Type::Object)
        fill(property.objects->GetObjects<Serialisable>(), &InSerialiserProperty::object);
    else
        fill(property.objects->GetObjects<SharedSerialisable>(), &InSerialiserProperty::shared);
    m_stack.resize(base);
    return true;
}

bool InSerialiserLoader::ParseObjects(InSerialiserProperty& property)
{
    using Type = InSerialiserProperty::Type;
    u32 count = 0;
    if (!m_source.ReadNumber(count) || !m_source.Fits(count)) return false;
    size_t const base = m_stack.size();
    Type kind = Type::NullObject;
    for (u32 i = 0; i < count; ++i) {
        OwnedProperty element;
        if (!ReadObject(element.property)) return false;
        if (element.property.kind != Type::NullObject) {
            if (kind != Type::NullObject && kind != element.property.kind) return false;
            kind = element.property.kind;
        } else if (kind == Type::NullObject)
            continue;
        m_stack.push_back(element.property);
        element.Disown();
    }
    if (kind == Type::NullObject) {
        property.number = count;
        property.kind = Type::NullArray;
        return true;
    }
    if (!StoreObjects(property, kind, count, base)) return false;
    property.kind = kind == Type::Object ? Type::ObjectArray : Type::SharedObjectArray;
    return true;
}

// Classes.

bool InSerialiserLoader::ReadClassRecord(ClassResult& result)
{
    u8 first = 0;
    if (!m_source.ReadNumber(first)) return false;
    switch (static_cast<ClassRecord>(first)) {
    case ClassRecord::None: return true;
    case ClassRecord::Known: return ReadKnownClass(result);
    case ClassRecord::Described: return ReadClassDescription(result);
    }
    return false;
}

bool InSerialiserLoader::ReadKnownClass(ClassResult& result)
{
    ClassUID uid;
    if (!m_source.ReadNumber(uid.value)) return false;
    if (!m_lastClass || m_lastClass->GetProperties().GetClassUID() != uid) {
        auto const at = m_classes.find(uid.value);
        if (at == m_classes.end()) {
            if (ClassPropertiesBase::FindClassPropertiesBase(uid)) return false;
            HandleUnknown(uid, result);
            return true;
        }
        m_lastClass = at->second.Get();
    }
    result.info = m_lastClass;
    return true;
}

void InSerialiserLoader::HandleUnknown(ClassUID uid, ClassResult& result) const
{
    if (m_checks) throw UnknownClassUIDException(uid);
    result.info = nullptr;
    result.isUnknown = true;
}

bool InSerialiserLoader::ReadClassDescription(ClassResult& result)
{
    ClassUID uid;
    u16 version = 0;
    ClassResult parent;
    if (!m_source.ReadNumber(uid.value) || !m_source.ReadNumber(version)) return false;
    ClassPropertiesBase const* const properties = ClassPropertiesBase::FindClassPropertiesBase(uid);
    if (!properties) {
        Trace(FormatT<String8>(">>> Unknown class: %1\n", TagText(uid)));
        m_source.OpenList();
        if (!SkipProperties()) return false;
        m_source.CloseList();
        if (!ReadParent(parent)) return false;
        HandleUnknown(uid, result);
        return true;
    }
    auto const [at, isNew] = m_classes.try_emplace(uid.value);
    if (!isNew) return false;
    at->second = new InSerialiserClassInfoBase(*properties, version);
    InSerialiserClassInfoBase& info = *at->second;
    if (!ParseDefaults(info) || !ReadParent(parent)) return false;
    if (parent.info && parent.info->IsOpen()) return false;
    info.Close(parent.info);
    TraceParent(*properties, parent.info ? &parent.info->GetProperties() : nullptr, parent.isUnknown);
    result.info = &info;
    return true;
}

bool InSerialiserLoader::ReadParent(ClassResult& result)
{
    NestingGuard const level;
    return level.IsAllowed() && ReadClassRecord(result);
}

bool InSerialiserLoader::ParseDefaults(InSerialiserClassInfoBase& info)
{
    ++m_defaultsNesting;
    m_source.OpenList();
    for (;;) {
        OwnedProperty item;
        if (!m_source.ReadItemByte(item.property.typeByte)) return false;
        if (item.property.typeByte == 0) break;
        if (!ParseProperty(item.property)) return false;
        info.AddDefault(item.property);
        item.Disown();
    }
    m_source.CloseList();
    --m_defaultsNesting;
    return true;
}

} // namespace Kernel
