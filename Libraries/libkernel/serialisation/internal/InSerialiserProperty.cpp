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

namespace {

template <class P>
void DestroyObjects(StoredObjects& objects)
{
    std::destroy_n(objects.GetObjects<P>(), objects.count);
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
    case Type::ObjectArray: DestroyObjects<Counted<Serialisable>>(*objects); break;
    case Type::SharedObject: shared->Release(); break;
    case Type::SharedObjectArray: DestroyObjects<Consolidated<SharedSerialisable>>(*objects); break;
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

u32 SortProperties(InSerialiserProperty* properties, u32 count)
{
    constexpr u32 c_insertionSorted = 24;
    auto const less = [](InSerialiserProperty const& a, InSerialiserProperty const& b) { return a.tag < b.tag; };
    u32 ordered = 1;
    while (ordered < count && properties[ordered - 1].tag < properties[ordered].tag) ++ordered;
    if (ordered >= count) return count;
    if (count > c_insertionSorted)
        std::stable_sort(properties, properties + count, less);
    else {
        for (u32 i = ordered; i < count; ++i) {
            InSerialiserProperty const moved = properties[i];
            u32 to = i;
            for (; to > 0 && moved.tag < properties[to - 1].tag; --to) properties[to] = properties[to - 1];
            properties[to] = moved;
        }
    }
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

} // namespace Kernel
