#pragma once

#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/FlagSerialiser.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/InSerialiserPropertyDataStream.h"
#include "libkernel/serialisation/Serialisable.h"
#include "libkernel/serialisation/SharedSerialisable.h"

#include <nlohmann/json.hpp>

namespace Kernel::Test {

/// Calls every load operation on every tag of a list and of the inline classes in it. Gives how many succeeded, so that
/// the work can't be left out.
inline u64 LoadEverything(InSerialiser const& in);

namespace LoadEverythingDetail {

template <class T>
u64 LoadNumber(InSerialiser const& in, IDTag tag)
{
    T value{};
    T values[3] = {};
    std::vector<T> all;
    u64 stored = 0;
    return u64(in.LoadType(tag, value)) + in.LoadTypes(tag, all) + in.LoadTypes(tag, values, 3) +
           in.LoadTypes(tag, values, 3, &stored);
}

template <class... T>
u64 LoadNumbers(InSerialiser const& in, IDTag tag)
{
    return (u64(0) + ... + LoadNumber<T>(in, tag));
}

inline u64 LoadOne(InSerialiser const& in, IDTag tag)
{
    u64 loads = LoadNumbers<u8, u16, u32, u64, i8, i16, i32, i64, float, double, IDTag, ClassUID>(in, tag);
    loads += LoadNumbers<String8, String16, String32>(in, tag);
    bool flag = false;
    bool flags[2] = {};
    std::vector<bool> bools;
    std::deque<bool> boolDeque;
    nlohmann::json json;
    loads += in.LoadType(tag, flag) + in.LoadTypes(tag, bools) + in.LoadTypes(tag, boolDeque) +
             in.LoadTypes(tag, flags, 2) + in.LoadType(tag, json);
    u8 buffer[256] = {};
    u64 count = 0;
    for (u64 size : {u64(0), u64(1), u64(4), u64(64), u64(255)})
        loads += u64(in.LoadTypeCustomI(tag, buffer, size)) + (in.LoadTypeCustomArrayI(tag, size, count) != nullptr) +
                 in.LoadRawStructI(tag, buffer, size);
    RawDataBlock raw;
    Counted<FragmentedRawData> fragmented;
    InSerialiserPropertyDataStream stream;
    loads += u64(in.LoadRawData(tag, raw)) + in.LoadRawData(tag, raw, true) + in.LoadFragmentedRawData(tag, fragmented);
    loads += in.LoadDataStream(tag, stream);
    EnumSerialiser const noEnums;
    FlagSerialiser const noFlags;
    int number = 0;
    std::vector<int> numbers;
    u64 bits = 0;
    try {
        loads += u64(in.LoadEnumI(tag, noEnums, number)) + in.LoadEnumI(tag, noEnums, numbers) +
                 in.LoadEnumI(tag, noEnums, &number, 1) + in.LoadFlagSetI(tag, noFlags, bits, 8);
    } catch (UnknownEnumVersionException const&) {
        ++loads;
    } catch (UnknownFlagVersionException const&) {
        ++loads;
    }
    Counted<Serialisable> object;
    Consolidated<SharedSerialisable> shared;
    std::vector<Counted<Serialisable>> objects;
    std::vector<Consolidated<SharedSerialisable>> sharedObjects;
    Counted<DelayLoadHolder> holder;
    loads += u64(in.LoadObjectI(tag, object, true)) + in.LoadSharedObjectI(tag, shared) +
             in.LoadObjectOrSharedObjectI(tag, object, shared, false) + in.LoadObjectsBase(tag, objects, true) +
             in.LoadSharedObjectsBase(tag, sharedObjects) + in.LoadDelayLoadObject(tag, holder);
    ClassUID uid;
    unsigned short version = 0;
    if (auto const nested = in.LoadClassI(tag, uid, version)) loads += 1 + LoadEverything(*nested);
    if (auto const* const lists = in.LoadClassesI(tag, uid, version)) {
        ++loads;
        for (auto const& nested : *lists)
            if (nested) loads += LoadEverything(*nested);
    }
    InSerialiser::PropertyTypeParams params;
    return loads + in.HasPropertyOrDefault(tag) + in.GetPropertyParams(tag, params);
}

} // namespace LoadEverythingDetail

inline u64 LoadEverything(InSerialiser const& in)
{
    u64 loads = 0;
    for (IDTag tag : in.GetTags()) loads += LoadEverythingDetail::LoadOne(in, tag);
    return loads;
}

} // namespace Kernel::Test
