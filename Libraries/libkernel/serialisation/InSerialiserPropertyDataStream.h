#pragma once

#include "libkernel/core/RawData.h"
#include "libkernel/core/String.h"
#include "libkernel/serialisation/PropType.h"

#include <array>
#include <cstring>
#include <deque>
#include <string_view>
#include <type_traits>
#include <vector>

namespace Kernel {

class EnumSerialiser;

/// Reads a data stream property in place: values without keys, in the order in which they were written.
///
/// A plain value that points into the list it came from and is valid as long as that is (InSerialiser). Every Load
/// reads the current item if its type, and its scalar or array form, match, and moves to the next; otherwise it answers
/// false and changes nothing. Behind the last item the type is EndOfList and nothing loads. A new one is empty.
class KERNEL_API InSerialiserPropertyDataStream
{
public:
    /// Type of the current item.
    PropType GetCurrentPropType() const { return m_type; }
    bool IsArray() const { return m_isArray; }
    /// Elements of the current array; 0 for a scalar.
    u64 GetArrayCount() const { return m_isArray ? m_count : 0; }
    /// Bytes of a raw struct, a custom block or raw data, or of one element of an array of such; 0 for other types.
    u64 GetStructByteSize() const;
    /// The number that the writer gave the stream.
    unsigned short GetVersion() const { return m_version; }

    /// A scalar of exactly that type and size; raw structs too.
    bool LoadValueI(PropType type, void* value, u64 size);
    /// An array of that type and element size: gives the elements, packed and unaligned, and their count. Null if the
    /// current item is no such array.
    void const* LoadValueArrayI(PropType type, u64 unitSize, u64& count);
    template <PropValue T>
    bool LoadValue(T& value)
    {
        return LoadValueI(PropTypeOf<T>(), &value, sizeof(T));
    }
    bool LoadValue(bool& value);
    bool LoadValue(String8& text);
    bool LoadValue(String16& text);
    bool LoadValue(String32& text);

    template <PropValue T>
    bool LoadValues(std::vector<T>& values);
    bool LoadValues(std::vector<bool>& values);
    bool LoadValues(std::deque<bool>& values);
    bool LoadValues(std::vector<String8>& texts);
    bool LoadValues(std::vector<String16>& texts);
    bool LoadValues(std::vector<String32>& texts);
    /// Into the caller's array: the rule of InSerialiser::LoadTypes.
    template <PropValue T>
    bool LoadValues(T* values, u64 capacity, u64* stored = nullptr);
    template <PropValue T, size_t N>
    bool LoadValues(std::array<T, N>& values)
    {
        return LoadValues(values.data(), N);
    }

    /// A custom block of exactly that size, and an array of such: as LoadValueArrayI.
    bool LoadValueCustomI(void* value, u64 size);
    void const* LoadValueCustomArrayI(u64 unitSize, u64& count);
    template <class T>
    requires std::is_trivially_copyable_v<T>
    bool LoadValueStruct(T& value) { return LoadValueCustomI(&value, sizeof(T)); }
    template <class T>
    requires std::is_trivially_copyable_v<T>
    bool LoadValueStructs(std::vector<T>& values);
    /// Raw data, copied. False too if there is no memory for it.
    bool LoadValueRaw(RawDataBlock& data);

    /// Enum values through their serialiser; throw UnknownEnumVersionException, without moving on, for a value that it
    /// does not know.
    bool LoadEnumI(EnumSerialiser const& serialiser, int& value);
    bool LoadEnumI(EnumSerialiser const& serialiser, std::vector<int>& values);
    template <class E>
    requires std::is_enum_v<E>
    bool LoadEnum(EnumSerialiser const& serialiser, E& value)
    {
        int number = 0;
        if (!LoadEnumI(serialiser, number)) return false;
        value = static_cast<E>(number);
        return true;
    }

private:
    friend class InSerialiser;

    // The items from @p at to @p end have been checked; the byte 0 is not among them.
    void Init(u8 const* at, u8 const* end, unsigned short version);
    void LoadNextItem();
    bool IsCurrent(PropType type, bool isArray) const { return m_type == type && m_isArray == isArray; }
    template <class Enc>
    bool LoadTextI(StringT<Enc>& text);
    template <class Enc>
    bool LoadTextsI(std::vector<StringT<Enc>>& texts);
    template <class Bools>
    bool LoadBoolsI(Bools& values);

    u8 const* m_next = nullptr; // The item behind the current one.
    u8 const* m_end = nullptr;
    u8 const* m_payload = nullptr; // Of the current item.
    u64 m_payloadSize = 0;
    u64 m_count = 0;
    u64 m_unitSize = 0;
    u16 m_enumVersion = 0;
    u16 m_version = 0;
    PropType m_type = PropType::EndOfList;
    bool m_isArray = false;
};

template <PropValue T>
bool InSerialiserPropertyDataStream::LoadValues(std::vector<T>& values)
{
    u64 count = 0;
    void const* const stored = LoadValueArrayI(PropTypeOf<T>(), sizeof(T), count);
    if (!stored) return false;
    values.resize(count);
    if (count) std::memcpy(values.data(), stored, count * sizeof(T));
    return true;
}

template <PropValue T>
bool InSerialiserPropertyDataStream::LoadValues(T* values, u64 capacity, u64* stored)
{
    if (!IsCurrent(PropTypeOf<T>(), true) || (!stored && capacity != m_count)) return false;
    u64 count = 0;
    void const* const from = LoadValueArrayI(PropTypeOf<T>(), sizeof(T), count);
    u64 const copied = count < capacity ? count : capacity;
    if (copied) std::memcpy(values, from, copied * sizeof(T));
    if (stored) *stored = count;
    return true;
}

template <class T>
requires std::is_trivially_copyable_v<T>
bool InSerialiserPropertyDataStream::LoadValueStructs(std::vector<T>& values)
{
    u64 count = 0;
    void const* const stored = LoadValueCustomArrayI(sizeof(T), count);
    if (!stored) return false;
    values.resize(count);
    if (count) std::memcpy(values.data(), stored, count * sizeof(T));
    return true;
}

} // namespace Kernel
