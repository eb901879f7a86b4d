#include "libkernel/core/Endian.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filestore/FileStore.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/filestore/FileStoreItemType.h"
#include "libkernel/filestore/FileStoreOut.h"
#include "libkernel/filestore/FileStoreOutPathGenerator.h"
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/serialisation/OutSerialiserObjectList.h"
#include "libkernel/serialisation/internal/DefaultTable.h"
#include "libkernel/serialisation/internal/OutSerialiserInline.h"
#include "libkernel/serialisation/internal/PropWriter.h"

// Objects, classes and references to stored items. Each structure has two forms here: the one that writes, and the one
// that only walks, so that a store that enumerates hears of every item before the real save begins.

namespace Kernel {

namespace {

constexpr u8 c_objectType = static_cast<u8>(PropType::Object);
constexpr u8 c_classType = static_cast<u8>(PropType::Class);

} // namespace

// Of an object.
inline OutSerialiser::OutSerialiser(OutSerialiser& parent, OutSerialiserClass& known)
    : m_target(parent.m_target), m_store(parent.m_store), m_objects(parent.m_objects),
      m_step(known.steps ? known.steps : &s_noStep), m_firstStep(known.steps), m_abort(parent.m_abort), m_class(&known),
      m_advice(parent.m_advice), m_obstacles(parent.m_obstacles & Enumerating), m_isFileLevel(false)
{
}

void OutSerialiser::SaveObject(IDTag tag, NonCounted<Serialisable const> object, bool isOwner)
{
    StartI(tag);
    if (IsFullSave()) PutHeaderI(tag, c_objectType, 0);
    SaveObjectI(object, isOwner);
}

void OutSerialiser::SaveSharedObject(IDTag tag, Consolidated<SharedSerialisable> const& object)
{
    DefaultRow const* const row = StartI(tag);
    auto const* const item = row ? row->As<Defaults::DefaultSharedObject>() : nullptr;
    if (item && item->Compare(object)) return;
    if (IsFullSave()) PutHeaderI(tag, c_objectType, 0);
    SaveSharedObjectI(object);
}

DefaultRow const* OutSerialiser::FindDefaultI(IDTag tag) const
{
    return m_class && m_class->defaults ? m_class->defaults->Find(tag) : nullptr;
}

bool OutSerialiser::HasDefaultI(IDTag tag) const
{
    return FindDefaultI(tag) != nullptr;
}

bool OutSerialiser::TestDefaultObjectsI(IDTag tag, std::vector<Consolidated<SharedSerialisable>> const& objects) const
{
    DefaultRow const* const row = FindDefaultI(tag);
    auto const* const item = row ? row->As<Defaults::DefaultSharedObjectArray>() : nullptr;
    return item && item->Compare(objects);
}

void OutSerialiser::StartObjectArrayTestI(IDTag tag)
{
    StartI(tag);
}

void OutSerialiser::StartObjectArrayBeginI(IDTag tag, u64 count)
{
    if (!IsFullSave()) return;
    u32 const stored = CheckCountI(count);
    StoreLittleEndian(PutHeaderI(tag, c_objectType | c_propArrayBit, 4), stored);
}

// Objects and the map lie all over memory. The next of a row is on its way while this one is saved, which for most
// objects of a tree is over soon.
void OutSerialiser::PrefetchI(Serialisable const* next) const
{
    __builtin_prefetch(next);
    m_objects.Prefetch(next);
}

void OutSerialiser::PutObjectRecordI(ObjectRecord kind, u32 index)
{
    u8* const to = ClaimI(5);
    to[0] = static_cast<u8>(kind);
    StoreLittleEndian(to + 1, index);
}

void OutSerialiser::SaveObjectI(NonCounted<Serialisable const> object, bool isOwner)
{
    if (!IsFullSave()) return object ? SaveObjectEnumeratePathsOnlyI(*object) : void();
    if (!object) {
        *ClaimI(1) = static_cast<u8>(ObjectRecord::Null);
        return;
    }
    u32 index = 0;
    bool isNew = false;
    auto& record = m_objects.FindOrAdd(object.Get(), index, isNew);
    record.isOwned |= isOwner;
    if (isNew)
        SaveObjectBodyI(*object, index);
    else
        PutObjectRecordI(ObjectRecord::Back, index);
}

void OutSerialiser::SaveSharedObjectI(Consolidated<SharedSerialisable> const& object)
{
    if (!IsFullSave()) return object ? SaveSharedObjectEnumeratePathsOnlyI(*object) : void();
    if (!object) {
        *ClaimI(1) = static_cast<u8>(ObjectRecord::Null);
        return;
    }
    u32 index = 0;
    bool isNew = false;
    auto& record = m_objects.FindOrAddShared(object.Get(), index, isNew);
    if (record.isWriting) Fail(SaveException::Misuse);
    if (!isNew) return PutObjectRecordI(ObjectRecord::Back, index);
    record.isWriting = true;
    SaveObjectBodyI(*object, index);
    record.isWriting = false;
}

template <class T>
void OutSerialiser::SaveObjectBodyI(T const& object, u32 index)
{
    NestingGuard const level;
    ClassPropertiesBase const* const description = object.GetObjectClassProperties();
    if (!description || !level.IsAllowed()) Fail(SaveException::Misuse);
    OutSerialiserClass& known = m_objects.GetClass(*description);
    if (known.isDescribed) {
        u8* const to = ClaimI(10);
        StoreLittleEndian(to, static_cast<u64>(ObjectRecord::First) | u64{index} << 8 |
                                  static_cast<u64>(ClassRecord::Known) << 40);
        StoreLittleEndian(to + 6, description->GetClassUID().value);
    } else {
        PutObjectRecordI(ObjectRecord::First, index);
        SaveClassInfoI(description);
    }
    SaveMembersI(object, known);
}

// On an exception the mark of the active child stays, so that nobody writes on behind half an object.
template <class T>
void OutSerialiser::SaveMembersI(T const& object, OutSerialiserClass& known)
{
    m_obstacles |= ChildActive;
    {
        OutSerialiser child(*this, known);
        object.Save(child);
        child.Close();
    }
    m_obstacles &= static_cast<u8>(~ChildActive);
}

void OutSerialiser::SaveClassInfoI(ClassPropertiesBase const* description)
{
    if (!description) {
        *ClaimI(1) = static_cast<u8>(ClassRecord::None);
        return;
    }
    OutSerialiserClass& known = m_objects.GetClass(*description);
    u8* const record = ClaimI(known.isDescribed ? 5 : 7);
    record[0] = static_cast<u8>(known.isDescribed ? ClassRecord::Known : ClassRecord::Described);
    StoreLittleEndian(record + 1, description->GetClassUID().value);
    if (known.isDescribed) return;
    StoreLittleEndian(record + 5, static_cast<u16>(description->GetSchemaVersion()));
    for (auto const& [tag, item] : description->GetDefaults()) SaveDefaultI(*item);
    *ClaimI(1) = 0;
    known.isDescribed = true;
    NestingGuard const level;
    if (!level.IsAllowed()) Fail(SaveException::Misuse);
    SaveClassInfoI(description->GetParentClassProperties());
}

void OutSerialiser::SaveDefaultI(Defaults::DefaultBase const& item)
{
    using Defaults::DefaultItemType;
    IDTag const tag = item.GetIDTag();
    switch (item.GetDefaultType()) {
    case DefaultItemType::Type: {
        auto const& scalar = static_cast<Defaults::DefaultType const&>(item);
        PutHeaderI(tag, static_cast<u8>(scalar.GetPropType()), 0);
        return PutI(scalar.GetBytes().data(), scalar.GetBytes().size());
    }
    case DefaultItemType::TypeArray: {
        auto const& array = static_cast<Defaults::DefaultTypeArray const&>(item);
        u32 const count = CheckCountI(array.GetCount());
        StoreLittleEndian(PutHeaderI(tag, static_cast<u8>(array.GetPropType()) | c_propArrayBit, 4), count);
        return PutI(array.GetBytes().data(), array.GetBytes().size());
    }
    case DefaultItemType::String: {
        String8 const& text = static_cast<Defaults::DefaultString const&>(item).GetText();
        u32 const length = static_cast<u32>(text.GetLength());
        StoreLittleEndian(PutHeaderI(tag, static_cast<u8>(PropType::String), 4), length);
        return PutI(text.GetData(), length);
    }
    case DefaultItemType::Custom: {
        auto const& bytes = static_cast<Defaults::DefaultCustom const&>(item).GetBytes();
        u16 const size = CheckShortI(bytes.size());
        StoreLittleEndian(PutHeaderI(tag, static_cast<u8>(PropType::Custom), 2), size);
        return PutI(bytes.data(), bytes.size());
    }
    case DefaultItemType::CustomArray: {
        auto const& array = static_cast<Defaults::DefaultCustomArray const&>(item);
        u32 const count = CheckCountI(array.GetCount());
        u16 const unitSize = CheckShortI(array.GetUnitSize());
        u8* const header = PutHeaderI(tag, static_cast<u8>(PropType::Custom) | c_propArrayBit, 6);
        StoreLittleEndian(header, count);
        StoreLittleEndian(header + 4, unitSize);
        return PutI(array.GetBytes().data(), array.GetBytes().size());
    }
    case DefaultItemType::Enum: {
        auto const& value = static_cast<Defaults::DefaultEnum const&>(item);
        u8* const to = PutHeaderI(tag, static_cast<u8>(PropType::Enum), 4);
        StoreLittleEndian(to, value.GetCode());
        StoreLittleEndian(to + 2, value.GetVersion());
        return;
    }
    case DefaultItemType::EnumArray: {
        auto const& array = static_cast<Defaults::DefaultEnumArray const&>(item);
        u32 const count = CheckCountI(array.GetCodes().size());
        u8* const header = PutHeaderI(tag, static_cast<u8>(PropType::Enum) | c_propArrayBit, 6);
        StoreLittleEndian(header, count);
        StoreLittleEndian(header + 4, array.GetVersion());
        return PutI(array.GetCodes().data(), array.GetCodes().size() * sizeof(u16));
    }
    case DefaultItemType::FlagSet: {
        auto const& flags = static_cast<Defaults::DefaultFlagSet const&>(item);
        return PutFlagSetI(tag, flags.GetEncoded(), flags.GetVersion(), flags.GetActiveBytes());
    }
    case DefaultItemType::SharedObject:
        PutHeaderI(tag, c_objectType, 0);
        return SaveSharedObjectI(static_cast<Defaults::DefaultSharedObject const&>(item).GetObject());
    case DefaultItemType::SharedObjectArray: {
        auto const& objects = static_cast<Defaults::DefaultSharedObjectArray const&>(item).GetObjects();
        StartObjectArrayBeginI(tag, objects.size());
        for (auto const& object : objects) SaveSharedObjectI(object);
        return;
    }
    case DefaultItemType::StringArray: break; // No wire form.
    }
    Fail(SaveException::Misuse);
}

void OutSerialiser::SaveObjectEnumeratePathsOnlyI(Serialisable const& object)
{
    u32 index = 0;
    bool isNew = false;
    m_objects.FindOrAdd(&object, index, isNew);
    if (isNew) EnumerateObjectBodyI(object);
}

void OutSerialiser::SaveSharedObjectEnumeratePathsOnlyI(SharedSerialisable const& object)
{
    u32 index = 0;
    bool isNew = false;
    auto& record = m_objects.FindOrAddShared(&object, index, isNew);
    if (record.isWriting) Fail(SaveException::Misuse);
    if (!isNew) return;
    record.isWriting = true;
    EnumerateObjectBodyI(object);
    record.isWriting = false;
}

template <class T>
void OutSerialiser::EnumerateObjectBodyI(T const& object)
{
    NestingGuard const level;
    ClassPropertiesBase const* const description = object.GetObjectClassProperties();
    if (!description || !level.IsAllowed()) Fail(SaveException::Misuse);
    SaveClassInfoEnumeratePathsOnlyI(description);
    SaveMembersI(object, m_objects.GetClass(*description));
}

void OutSerialiser::SaveClassInfoEnumeratePathsOnlyI(ClassPropertiesBase const* description)
{
    using Defaults::DefaultItemType;
    if (!description) return;
    OutSerialiserClass& known = m_objects.GetClass(*description);
    if (known.isDescribed) return;
    for (auto const& [tag, item] : description->GetDefaults()) {
        DefaultItemType const kind = item->GetDefaultType();
        if (kind == DefaultItemType::StringArray || kind > DefaultItemType::SharedObjectArray)
            Fail(SaveException::Misuse);
        if (kind == DefaultItemType::SharedObject)
            SaveSharedObjectI(static_cast<Defaults::DefaultSharedObject const&>(*item).GetObject());
        if (kind != DefaultItemType::SharedObjectArray) continue;
        for (auto const& object : static_cast<Defaults::DefaultSharedObjectArray const&>(*item).GetObjects())
            SaveSharedObjectI(object);
    }
    known.isDescribed = true;
    NestingGuard const level;
    if (!level.IsAllowed()) Fail(SaveException::Misuse);
    SaveClassInfoEnumeratePathsOnlyI(description->GetParentClassProperties());
}

void OutSerialiser::StartClassTestI(IDTag tag)
{
    StartI(tag);
}

void OutSerialiser::StartClassBeginI(IDTag tag, ClassUID const& classUID, unsigned short version)
{
    m_obstacles |= ChildActive;
    if (!IsFullSave()) return;
    u8* const to = PutHeaderI(tag, c_classType, 7);
    to[0] = 1;
    StoreLittleEndian(to + 1, classUID.value);
    StoreLittleEndian(to + 5, version);
}

void OutSerialiser::EndPropClassI()
{
    m_obstacles &= static_cast<u8>(~ChildActive);
}

void OutSerialiser::SaveNullPropClassI(IDTag tag)
{
    StartI(tag);
    if (IsFullSave()) *PutHeaderI(tag, c_classType, 1) = 0;
}

void OutSerialiser::StartClassArrayTestI(IDTag tag)
{
    StartI(tag);
}

void OutSerialiser::StartClassArrayBeginI(IDTag tag, ClassUID const& classUID, unsigned short version, u64 count)
{
    u32 const stored = CheckCountI(count);
    m_obstacles |= ChildActive;
    if (!IsFullSave()) return;
    u8* const to = PutHeaderI(tag, c_classType | c_propArrayBit, 10);
    StoreLittleEndian(to, stored);
    StoreLittleEndian(to + 4, classUID.value);
    StoreLittleEndian(to + 8, version);
}

void OutSerialiser::StartClassArrayClassI()
{
    if (IsFullSave()) *ClaimI(1) = 1;
}

void OutSerialiser::StartClassArrayClassNullI()
{
    if (IsFullSave()) *ClaimI(1) = 0;
}

void OutSerialiser::EndPropClassArrayI()
{
    m_obstacles &= static_cast<u8>(~ChildActive);
}

void OutSerialiser::SaveDelayLoadObject(IDTag tag, Counted<DelayLoadHolder> const& holder,
                                        FileStoreOutPathGenerator& generator, Counted<FileStoreCompressionHint> hint)
{
    StartI(tag);
    if (!holder && !IsFullSave()) return;
    ClassUID itemType;
    String8 path;
    if (holder) {
        itemType = holder->GetFileStoreItemType()->GetClassUID();
        if (m_store.GetPurpose() != FileStoreOut::PurposeEnumerateHolders) path = GetHolderPathI(holder, generator);
    }
    if (IsFullSave()) {
        u8* const header = PutHeaderI(tag, static_cast<u8>(PropType::DelayLoad), 8);
        StoreLittleEndian(header, itemType.value);
        StoreLittleEndian(header + 4, static_cast<u32>(path.GetLength()));
        PutI(path.GetData(), static_cast<u64>(path.GetLength()));
    }
    if (holder) m_store.CreateFile(holder, hint);
}

String8 OutSerialiser::GetHolderPathI(Counted<DelayLoadHolder> const& holder, FileStoreOutPathGenerator& generator)
{
    String8 path;
    if (holder->GetPath(m_store.GetFileStore(), path)) return path;
    // The path may be made from what the item says, but an item is not loaded only for its name.
    JailCounted<FileStoreItem> item;
    if (holder->ExistsOnlyInMemory()) {
        item = holder->GetItemBaseIfLoaded();
        if (!item) Fail(SaveException::NoPath);
    }
    if (!generator.GeneratePath(item.Get(), holder, path)) Fail(SaveException::NoPath);
    m_store.AssignDelayLoadHolderPath(holder, path);
    return path;
}

} // namespace Kernel
