#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/FragmentedRawData.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/RawData.h"
#include "libkernel/core/String.h"
#include "libkernel/serialisation/InSerialiserProperty.h"
#include "libkernel/serialisation/PropType.h"

#include <array>
#include <cstring>
#include <deque>
#include <string_view>
#include <type_traits>
#include <typeinfo>
#include <vector>

namespace Kernel {

class DelayLoadHolder;
class EnumSerialiser;
class FlagSerialiser;
class InSerialiserClassInfoBase;
class InSerialiserLoader;
class InSerialiserObjectMarkers;
class InSerialiserPropertyDataStream;
class Serialisable;
class SharedSerialisable;

/// One parsed property list: what an object's Load reads from, by tag and in any order.
///
/// Every Load operation takes the tag first, and answers false with its output untouched if the tag is absent or stands
/// for something of another kind, type or size. An operation that finds no property of its own looks in the defaults
/// that the file states for the class and its parents. One thread at a time.
///
/// A list inside a parse is emptied as soon as the Load that it was made for has returned, and the lists nested in it
/// with it: whoever holds on to one finds nothing in it. Pointers that an operation gives are valid until then; those
/// of the root list and of the inline classes in it as long as the InSerialiserFile lives and the property is not torn
/// down.
class KERNEL_API InSerialiser : public Countable
{
public:
    /// What stands under a tag.
    using PropertyType = InSerialiserPropertyType;

    /// What a parse does with each reference to an item that is loaded on demand.
    enum class DelayLoadsBehaviour : int
    {
        Leave = 0, ///< The holder is made and left unloaded.
        Prove = 1, ///< The item is loaded, then released.
        Load = 2   ///< The item is loaded and stays.
    };

    struct PropertyTypeParams
    {
        PropType type = PropType::EndOfList;
        bool isArray = false;
        u64 arrayCount = 0; ///< 0 unless isArray.
    };

    InSerialiser(InSerialiser const&) = delete;
    InSerialiser& operator=(InSerialiser const&) = delete;

    /// True if the tag stands in this list.
    bool HasProperty(IDTag tag) const;
    /// True if the tag stands in this list or among the defaults of its class.
    bool HasPropertyOrDefault(IDTag tag) const;
    /// What stands under the tag in this list or among the defaults.
    PropertyType GetPropertyType(IDTag tag) const;
    /// Describes a PropertyType::Value; false for anything else.
    bool GetPropertyParams(IDTag tag, PropertyTypeParams& params) const;
    /// The tags of this list in ascending order, without defaults.
    std::vector<IDTag> GetTags() const;

    /// Build index of the library that wrote the file, 0 for a file of format version 1.
    u32 GetBuildIndex() const { return m_buildIndex; }
    /// The file that this was read from; empty unless somebody set it.
    String8 const& GetFilePath() const { return m_filePath; }
    void SetFilePath(String8 const& path) { m_filePath = path; }

    /// Removes one property, or all, and lets go of what they hold.
    void TearDown(IDTag tag) const;
    void TearDownAllProperties() const;

    /// A scalar of exactly that type and size.
    bool LoadTypeI(IDTag tag, PropType type, void* value, u64 size) const;
    /// An array of that type and element size: gives the elements, packed as they stand in the file and aligned to 8
    /// bytes, and their count. Null if there is none; not null for an empty array.
    void const* LoadTypeArrayI(IDTag tag, PropType type, u64 unitSize, u64& count) const;
    template <PropValue T>
    bool LoadType(IDTag tag, T& value) const
    {
        InSerialiserProperty const* const next = TakeNextI(tag, PropTypeOf<T>());
        if (!next) return LoadTypeI(tag, PropTypeOf<T>(), &value, sizeof(T));
        std::memcpy(static_cast<void*>(&value), &next->number, sizeof(T));
        return true;
    }
    bool LoadType(IDTag tag, bool& value) const;
    /// The text, converted from UTF-8. False too for a text longer than a string can be.
    bool LoadType(IDTag tag, String8& text) const;
    bool LoadType(IDTag tag, String16& text) const;
    bool LoadType(IDTag tag, String32& text) const;
    /// The text under the tag without a copy, not terminated.
    bool LoadTextView(IDTag tag, std::string_view& text) const;
    /// The value whose JSON text is stored; false too for bad text, or arrays and objects nested deeper than 1,000.
    template <JsonValue J>
    bool LoadType(IDTag tag, J& value) const;

    template <PropValue T>
    bool LoadTypes(IDTag tag, std::vector<T>& values) const;
    bool LoadTypes(IDTag tag, std::vector<bool>& values) const;
    bool LoadTypes(IDTag tag, std::deque<bool>& values) const;
    bool LoadTypes(IDTag tag, std::vector<String8>& texts) const;
    bool LoadTypes(IDTag tag, std::vector<String16>& texts) const;
    bool LoadTypes(IDTag tag, std::vector<String32>& texts) const;
    template <JsonValue J>
    bool LoadTypes(IDTag tag, std::vector<J>& values) const;
    /// Into the caller's array of @p capacity elements. With @p stored, as many as fit are copied and it is given the
    /// count in the file; without it the array must have exactly as many elements.
    template <PropValue T>
    bool LoadTypes(IDTag tag, T* values, u64 capacity, u64* stored = nullptr) const;
    bool LoadTypes(IDTag tag, bool* values, u64 capacity, u64* stored = nullptr) const;
    bool LoadTypes(IDTag tag, String8* texts, u64 capacity, u64* stored = nullptr) const;
    bool LoadTypes(IDTag tag, String16* texts, u64 capacity, u64* stored = nullptr) const;
    bool LoadTypes(IDTag tag, String32* texts, u64 capacity, u64* stored = nullptr) const;
    /// The array must have exactly N elements.
    template <class T, size_t N>
    bool LoadTypes(IDTag tag, std::array<T, N>& values) const
    {
        return LoadTypes(tag, values.data(), N);
    }

    /// A custom block of exactly that size.
    bool LoadTypeCustomI(IDTag tag, void* value, u64 size) const;
    /// An array of custom blocks of that size: as LoadTypeArrayI.
    void const* LoadTypeCustomArrayI(IDTag tag, u64 unitSize, u64& count) const;
    /// A raw struct of exactly that size, 1 to 64 bytes.
    bool LoadRawStructI(IDTag tag, void* value, u64 size) const;
    template <class T>
    requires std::is_trivially_copyable_v<T>
    bool LoadPropertyStruct(IDTag tag, T& value) const { return LoadTypeCustomI(tag, &value, sizeof(T)); }
    template <class T>
    requires std::is_trivially_copyable_v<T>
    bool LoadPropertyStructs(IDTag tag, std::vector<T>& values) const;
    template <class T>
    requires(std::is_trivially_copyable_v<T> && sizeof(T) <= c_maxRawStructSize) bool LoadRawStruct(IDTag tag,
                                                                                                    T& value) const
    {
        return LoadRawStructI(tag, &value, sizeof(T));
    }

    /// Raw data, written aligned or not. Copies it; or, with @p swap, gives its buffer for the one that the caller's
    /// block has, which a second call then gets. False too if there is no memory for the copy.
    bool LoadRawData(IDTag tag, RawDataBlock& data, bool swap = false) const;
    bool LoadFragmentedRawData(IDTag tag, Counted<FragmentedRawData>& data) const;
    /// Sets @p stream to the first item.
    bool LoadDataStream(IDTag tag, InSerialiserPropertyDataStream& stream) const;

    /// Enum values through their serialiser. Throw UnknownEnumVersionException for a value that it does not know. The
    /// array form is that of LoadTypes.
    bool LoadEnumI(IDTag tag, EnumSerialiser const& serialiser, int& value) const;
    bool LoadEnumI(IDTag tag, EnumSerialiser const& serialiser, std::vector<int>& values) const;
    bool LoadEnumI(IDTag tag, EnumSerialiser const& serialiser, int* values, u64 capacity, u64* stored = nullptr) const;
    template <class E>
    requires std::is_enum_v<E>
    bool LoadEnum(IDTag tag, EnumSerialiser const& serialiser, E& value) const;
    template <class E>
    requires std::is_enum_v<E>
    bool LoadEnums(IDTag tag, EnumSerialiser const& serialiser, std::vector<E>& values) const;

    /// Flags through their serialiser. False too if more than 8 bytes are stored, or if the set reaches beyond @p width
    /// bytes. Throws UnknownFlagVersionException for a version or a bit that the serialiser does not know.
    bool LoadFlagSetI(IDTag tag, FlagSerialiser const& serialiser, u64& flags, unsigned char width) const;
    /// @p F is an unsigned integer or an enum.
    template <class F>
    bool LoadFlagSet(IDTag tag, FlagSerialiser const& serialiser, F& flags) const;

    /// An object with identity. A stored null clears @p object and is true. @p owner says whether the caller takes the
    /// object as an owner or only refers to it: it counts in the report at the end of a parse.
    bool LoadObjectI(IDTag tag, Counted<Serialisable>& object, bool owner) const;
    bool LoadSharedObjectI(IDTag tag, Consolidated<SharedSerialisable>& object) const;
    /// Whichever of the two is stored; the other is cleared.
    bool LoadObjectOrSharedObjectI(IDTag tag, Counted<Serialisable>& object, Consolidated<SharedSerialisable>& shared,
                                   bool owner) const;
    /// Gives the objects in place, owned by the property. @p objects is null if all @p count are null.
    bool LoadObjectsI(IDTag tag, Serialisable* const*& objects, u64& count, bool owner) const;
    bool LoadSharedObjectsI(IDTag tag, SharedSerialisable* const*& objects, u64& count) const;
    bool LoadObjectsBase(IDTag tag, std::vector<Counted<Serialisable>>& objects, bool owner) const;
    bool LoadSharedObjectsBase(IDTag tag, std::vector<Consolidated<SharedSerialisable>>& objects) const;
    /// The same with the class checked: false, with the output untouched, if an object is not a @p T.
    template <class T>
    bool LoadObject(IDTag tag, Counted<T>& object, bool owner = true) const;
    template <class T>
    bool LoadObjects(IDTag tag, std::vector<Counted<T>>& objects, bool owner = true) const;
    template <class T>
    bool LoadSharedObject(IDTag tag, Consolidated<T>& object) const;
    template <class T>
    bool LoadSharedObjects(IDTag tag, std::vector<Consolidated<T>>& objects) const;

    /// The list of an inline class, with its class and version. Null if there is none, with the outputs untouched, or
    /// if a null class is stored, which gives class 0 and version 0.
    Counted<InSerialiser const> LoadClassI(IDTag tag, ClassUID& uid, unsigned short& version) const;
    /// The lists of an array of inline classes, null for null elements; null if there is no such array.
    std::vector<Counted<InSerialiser const>> const* LoadClassesI(IDTag tag, ClassUID& uid,
                                                                 unsigned short& version) const;
    /// Through T::Load(InSerialiser const&, ClassUID const&, unsigned short). False if there is none, it is null, or
    /// that Load refuses it, which may leave @p value half set.
    template <class T>
    bool LoadClass(IDTag tag, T& value) const;
    /// As LoadClass for each element; false, with the output untouched, if one is null or refused.
    template <class T>
    bool LoadClasses(IDTag tag, std::vector<T>& values) const;

    /// The holder of an item that is loaded on demand; clears it for a stored null.
    bool LoadDelayLoadObject(IDTag tag, Counted<DelayLoadHolder>& holder) const;

protected:
    InSerialiser() = default;
    ~InSerialiser() override;

private:
    friend class InSerialiserLoader;
    friend struct InSerialiserProperty;

    /// The next property in line if it is this scalar of at most 8 bytes, or null: whoever loads in the order in which
    /// the file was written needs no search.
    InSerialiserProperty const* TakeNextI(IDTag tag, PropType type) const
    {
        if (m_next >= m_count || m_properties[m_next].tag != tag || !m_properties[m_next].IsNumber(type))
            return nullptr;
        return &m_properties[m_next++];
    }
    void OwnObjectsI() const;
    inline InSerialiserProperty* FindPropertyI(IDTag tag) const;
    inline InSerialiserProperty const* FindPropertyOrDefaultI(IDTag tag) const;
    inline InSerialiserProperty const* FindValueI(IDTag tag, u8 typeByte) const;
    inline InSerialiserProperty const* FindKindI(IDTag tag, PropertyType kind) const;
    template <class Bools>
    bool LoadBoolsI(IDTag tag, Bools& values) const;
    template <class T>
    bool LoadArrayI(IDTag tag, PropertyType kind, T* const*& objects, u64& count) const;
    template <class Enc>
    bool LoadTextI(IDTag tag, StringT<Enc>& text) const;
    template <class Enc>
    bool LoadTextsI(IDTag tag, std::vector<StringT<Enc>>& texts) const;
    template <class Enc>
    bool LoadTextsI(IDTag tag, StringT<Enc>* texts, u64 capacity, u64* stored) const;
    // Object is Serialisable, which is complete only where this is used.
    template <class T, class Object>
    static Counted<T> CastI(Object* object);
    static bool IsJsonTextSafe(std::string_view text);

    // In a pool that outlives them. Const operations tear properties down.
    mutable InSerialiserProperty* m_properties = nullptr;
    mutable u64 m_tagBits = 0; // A tag whose bit is not there is not there.
    mutable u32 m_count = 0;
    mutable bool m_holdsSomething = false; // Otherwise tearing down need not look at the properties.
    mutable u32 m_next = 0;                // Behind the property found last, where the next one asked for mostly lies.
    u32 m_buildIndex = 0;
    InSerialiserClassInfoBase const* m_classInfo = nullptr; // Not owned; null at file level and in inline classes.
    Counted<InSerialiserObjectMarkers> m_markers;           // Null unless somebody wants the report.
    String8 m_filePath;
};

template <JsonValue J>
bool InSerialiser::LoadType(IDTag tag, J& value) const
{
    std::string_view text;
    if (!LoadTextView(tag, text) || !IsJsonTextSafe(text)) return false;
    J parsed = J::parse(text.begin(), text.end(), nullptr, false, true);
    if (parsed.is_discarded()) return false;
    value = std::move(parsed);
    return true;
}

template <JsonValue J>
bool InSerialiser::LoadTypes(IDTag tag, std::vector<J>& values) const
{
    std::vector<String8> texts;
    if (!LoadTypes(tag, texts)) return false;
    std::vector<J> parsed;
    parsed.reserve(texts.size());
    for (String8 const& text : texts) {
        if (!IsJsonTextSafe(text.GetView())) return false;
        parsed.push_back(J::parse(text.begin(), text.end(), nullptr, false, true));
        if (parsed.back().is_discarded()) return false;
    }
    values = std::move(parsed);
    return true;
}

template <PropValue T>
bool InSerialiser::LoadTypes(IDTag tag, std::vector<T>& values) const
{
    u64 count = 0;
    T const* const stored = static_cast<T const*>(LoadTypeArrayI(tag, PropTypeOf<T>(), sizeof(T), count));
    if (!stored) return false;
    values.assign(stored, stored + count);
    return true;
}

template <PropValue T>
bool InSerialiser::LoadTypes(IDTag tag, T* values, u64 capacity, u64* stored) const
{
    u64 count = 0;
    T const* const from = static_cast<T const*>(LoadTypeArrayI(tag, PropTypeOf<T>(), sizeof(T), count));
    if (!from || (!stored && capacity != count)) return false;
    for (u64 i = 0; i < count && i < capacity; ++i) values[i] = from[i];
    if (stored) *stored = count;
    return true;
}

template <class T>
requires std::is_trivially_copyable_v<T>
bool InSerialiser::LoadPropertyStructs(IDTag tag, std::vector<T>& values) const
{
    u64 count = 0;
    void const* const stored = LoadTypeCustomArrayI(tag, sizeof(T), count);
    if (!stored) return false;
    values.resize(count);
    if (count) std::memcpy(values.data(), stored, count * sizeof(T));
    return true;
}

template <class E>
requires std::is_enum_v<E>
bool InSerialiser::LoadEnum(IDTag tag, EnumSerialiser const& serialiser, E& value) const
{
    int number = 0;
    if (!LoadEnumI(tag, serialiser, number)) return false;
    value = static_cast<E>(number);
    return true;
}

template <class E>
requires std::is_enum_v<E>
bool InSerialiser::LoadEnums(IDTag tag, EnumSerialiser const& serialiser, std::vector<E>& values) const
{
    std::vector<int> numbers;
    if (!LoadEnumI(tag, serialiser, numbers)) return false;
    values.clear();
    values.reserve(numbers.size());
    for (int number : numbers) values.push_back(static_cast<E>(number));
    return true;
}

template <class F>
bool InSerialiser::LoadFlagSet(IDTag tag, FlagSerialiser const& serialiser, F& flags) const
{
    static_assert(std::is_enum_v<F> || std::is_unsigned_v<F>);
    u64 bits = 0;
    if (!LoadFlagSetI(tag, serialiser, bits, sizeof(F))) return false;
    flags = static_cast<F>(bits);
    return true;
}

template <class T, class Object>
Counted<T> InSerialiser::CastI(Object* object)
{
    // The most derived class is what is asked for nearly always, and comparing that is far cheaper than the search.
    if constexpr (requires { static_cast<T*>(object); }) {
        if (typeid(*object) == typeid(T)) return Counted<T>(static_cast<T*>(object));
    }
    return Counted<T>(dynamic_cast<T*>(object));
}

template <class T>
bool InSerialiser::LoadObject(IDTag tag, Counted<T>& object, bool owner) const
{
    Counted<Serialisable> loaded;
    if (!LoadObjectI(tag, loaded, owner)) return false;
    if (!loaded) {
        object.Reset();
        return true;
    }
    Counted<T> cast = CastI<T>(loaded.Get());
    if (!cast) return false;
    object = std::move(cast);
    return true;
}

template <class T>
bool InSerialiser::LoadObjects(IDTag tag, std::vector<Counted<T>>& objects, bool owner) const
{
    Serialisable* const* stored = nullptr;
    u64 count = 0;
    if (!LoadObjectsI(tag, stored, count, owner)) return false;
    std::vector<Counted<T>> cast(count);
    for (u64 i = 0; stored && i < count; ++i) {
        if (!stored[i]) continue;
        cast[i] = CastI<T>(stored[i]);
        if (!cast[i]) return false;
    }
    objects = std::move(cast);
    return true;
}

template <class T>
bool InSerialiser::LoadSharedObject(IDTag tag, Consolidated<T>& object) const
{
    Consolidated<SharedSerialisable> loaded;
    if (!LoadSharedObjectI(tag, loaded)) return false;
    Counted<T> cast(dynamic_cast<T*>(loaded.Get()));
    if (loaded && !cast) return false;
    object = Consolidated<T>::Trust(std::move(cast));
    return true;
}

template <class T>
bool InSerialiser::LoadSharedObjects(IDTag tag, std::vector<Consolidated<T>>& objects) const
{
    SharedSerialisable* const* stored = nullptr;
    u64 count = 0;
    if (!LoadSharedObjectsI(tag, stored, count)) return false;
    std::vector<Consolidated<T>> cast(count);
    for (u64 i = 0; stored && i < count; ++i) {
        if (!stored[i]) continue;
        cast[i] = Consolidated<T>::Trust(Counted<T>(dynamic_cast<T*>(stored[i])));
        if (!cast[i]) return false;
    }
    objects = std::move(cast);
    return true;
}

template <class T>
bool InSerialiser::LoadClass(IDTag tag, T& value) const
{
    ClassUID uid;
    unsigned short version = 0;
    Counted<InSerialiser const> const nested = LoadClassI(tag, uid, version);
    return nested && value.Load(*nested, uid, version);
}

template <class T>
bool InSerialiser::LoadClasses(IDTag tag, std::vector<T>& values) const
{
    ClassUID uid;
    unsigned short version = 0;
    std::vector<Counted<InSerialiser const>> const* const nested = LoadClassesI(tag, uid, version);
    if (!nested) return false;
    std::vector<T> loaded;
    loaded.reserve(nested->size());
    for (Counted<InSerialiser const> const& list : *nested) {
        if (!list || !loaded.emplace_back().Load(*list, uid, version)) return false;
    }
    values = std::move(loaded);
    return true;
}

} // namespace Kernel
