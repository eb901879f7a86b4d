#include "libkernel/serialisation/internal/InSerialiserProperty.h"

#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/serialisation/Serialisable.h"
#include "libkernel/serialisation/SharedSerialisable.h"

#include <algorithm>
#include <memory>

namespace Kernel {

std::string_view InSerialiserProperty::GetText() const
{
    if (isOwnString) return string->GetView();
    return {reinterpret_cast<char const*>(value->GetPayload()), value->count};
}

bool InSerialiserProperty::SetObject(Counted<Serialisable> taken)
{
    if (!taken) return false;
    object = taken.Detach();
    kind = Type::Object;
    return true;
}

void InSerialiserProperty::SetShared(Counted<SharedSerialisable> taken)
{
    shared = taken.Detach();
    kind = Type::SharedObject;
}

void InSerialiserProperty::Retain() const
{
    if (kind == Type::Object)
        object->Retain();
    else
        shared->Retain();
}

namespace {

template <class T>
void ReleaseObjects(StoredObjects& objects)
{
    T** const first = objects.GetObjects<T>();
    for (u64 i = 0; i < objects.count; ++i) {
        if (first[i]) first[i]->Release();
    }
}

u32 DropDuplicatesOfSorted(InSerialiserProperty* properties, u32 count)
{
    u32 kept = 0;
    for (u32 i = 1; i < count; ++i) {
        if (properties[i].tag == properties[kept].tag)
            properties[kept].Release();
        else
            ++kept;
        properties[kept] = properties[i];
    }
    return kept + 1;
}

u32 DropDuplicates(InSerialiserProperty* properties, u32 count)
{
    u32 kept = 0;
    for (u32 i = 0; i < count; ++i) {
        bool const isReplaced = std::any_of(properties + i + 1, properties + count,
                                            [&](InSerialiserProperty const& p) { return p.tag == properties[i].tag; });
        if (isReplaced)
            properties[i].Release();
        else
            properties[kept++] = properties[i];
    }
    return kept;
}

} // namespace

void InSerialiserProperty::Release()
{
    switch (kind) {
    case Type::Value:
        if (isOwnString) std::destroy_at(string);
        break;
    case Type::RawData: std::destroy_at(rawData); break;
    case Type::FragmentedRawData: std::destroy_at(fragments); break;
    case Type::Object: object->Release(); break;
    case Type::ObjectArray: ReleaseObjects<Serialisable>(*objects); break;
    case Type::SharedObject: shared->Release(); break;
    case Type::SharedObjectArray: ReleaseObjects<SharedSerialisable>(*objects); break;
    case Type::Class:
        if (inlineClass->list) inlineClass->list->TearDownAllProperties();
        std::destroy_at(inlineClass);
        break;
    case Type::ClassArray:
        for (Counted<InSerialiser const> const& list : classes->lists)
            if (list) list->TearDownAllProperties();
        std::destroy_at(classes);
        break;
    case Type::DelayLoad:
        if (holder) holder->Release();
        break;
    case Type::None:
    case Type::DataStream:
    case Type::NullObject:
    case Type::NullArray: break;
    }
    kind = Type::None;
    isOwnString = false;
    number = 0;
}

u32 ArrangeProperties(InSerialiserProperty* properties, u32 count, u64& tagBits)
{
    auto const less = [](InSerialiserProperty const& a, InSerialiserProperty const& b) { return a.tag < b.tag; };
    tagBits = 0;
    if (count > c_unsortedList) {
        tagBits = ~u64(0);
        if (!std::is_sorted(properties, properties + count, less))
            std::stable_sort(properties, properties + count, less);
        return DropDuplicatesOfSorted(properties, count);
    }
    bool mayRepeat = false;
    for (u32 i = 0; i < count; ++i) {
        u64 const bit = GetTagBit(properties[i].tag);
        mayRepeat |= (tagBits & bit) != 0;
        tagBits |= bit;
    }
    return mayRepeat ? DropDuplicates(properties, count) : count;
}

InSerialiserProperty* FindSorted(InSerialiserProperty* properties, u32 count, IDTag tag)
{
    InSerialiserProperty* const end = properties + count;
    InSerialiserProperty* const at = std::lower_bound(
        properties, end, tag, [](InSerialiserProperty const& a, IDTag wanted) { return a.tag < wanted; });
    return at != end && at->tag == tag ? at : nullptr;
}

} // namespace Kernel
