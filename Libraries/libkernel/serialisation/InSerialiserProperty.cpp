#include "libkernel/serialisation/InSerialiserProperty.h"

#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/serialisation/Serialisable.h"
#include "libkernel/serialisation/SharedSerialisable.h"
#include "libkernel/serialisation/internal/StoredProperty.h"

#include <algorithm>
#include <memory>

namespace Kernel {

std::string_view InSerialiserProperty::GetText() const
{
    if (isOwnString) return string->GetView();
    return {reinterpret_cast<char const*>(value->GetPayload()), value->count};
}

namespace {

template <class T, class Step>
void ForObjects(StoredObjects& objects, Step step)
{
    T** const first = objects.GetObjects<T>();
    for (u64 i = 0; i < objects.count; ++i) {
        if (first[i]) step(*first[i]);
    }
}

template <class Step>
void ForObjectsOf(InSerialiserProperty const& property, Step step)
{
    switch (property.kind) {
    case InSerialiserPropertyType::Object: step(*property.object); break;
    case InSerialiserPropertyType::SharedObject: step(*property.shared); break;
    case InSerialiserPropertyType::ObjectArray: ForObjects<Serialisable>(*property.objects, step); break;
    case InSerialiserPropertyType::SharedObjectArray: ForObjects<SharedSerialisable>(*property.objects, step); break;
    default: break;
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

void InSerialiserProperty::OwnObjects()
{
    switch (kind) {
    case Type::Object:
    case Type::ObjectArray:
    case Type::SharedObject:
    case Type::SharedObjectArray:
        ForObjectsOf(*this, [](Countable const& object) { object.Retain(); });
        ownsObjects = true;
        break;
    case Type::Class:
        if (inlineClass->list) inlineClass->list->OwnObjectsI();
        break;
    case Type::ClassArray:
        for (Counted<InSerialiser const> const& list : classes->lists)
            if (list) list->OwnObjectsI();
        break;
    default: break;
    }
}

bool InSerialiserProperty::HoldsSomething() const
{
    switch (kind) {
    case Type::Value: return isOwnString;
    case Type::Object:
    case Type::ObjectArray:
    case Type::SharedObject:
    case Type::SharedObjectArray: return ownsObjects;
    case Type::None:
    case Type::DataStream:
    case Type::NullObject:
    case Type::NullArray: return false;
    default: return true;
    }
}

void InSerialiserProperty::Release()
{
    switch (kind) {
    case Type::Value:
        if (isOwnString) std::destroy_at(string);
        break;
    case Type::RawData: std::destroy_at(rawData); break;
    case Type::FragmentedRawData: std::destroy_at(fragments); break;
    case Type::Object:
    case Type::ObjectArray:
    case Type::SharedObject:
    case Type::SharedObjectArray:
        if (ownsObjects) ForObjectsOf(*this, [](Countable const& o) { o.Release(); });
        break;
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
    isOwnString = ownsObjects = false;
    number = 0;
}

u32 ArrangeProperties(InSerialiserProperty* properties, u32 count, TagBits const& tags)
{
    if (count <= c_unsortedList) return tags.mayRepeat ? DropDuplicates(properties, count) : count;
    auto const less = [](InSerialiserProperty const& a, InSerialiserProperty const& b) { return a.tag < b.tag; };
    if (!std::is_sorted(properties, properties + count, less)) std::stable_sort(properties, properties + count, less);
    return DropDuplicatesOfSorted(properties, count);
}

InSerialiserProperty* FindSorted(InSerialiserProperty* properties, u32 count, IDTag tag)
{
    InSerialiserProperty* const end = properties + count;
    InSerialiserProperty* const at = std::lower_bound(
        properties, end, tag, [](InSerialiserProperty const& a, IDTag wanted) { return a.tag < wanted; });
    return at != end && at->tag == tag ? at : nullptr;
}

} // namespace Kernel
