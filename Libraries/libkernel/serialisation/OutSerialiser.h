#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/NestingGuard.h"
#include "libkernel/core/SourceLocation.h"
#include "libkernel/core/String.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/FlagSerialiser.h"
#include "libkernel/serialisation/OutSerialiserStep.h"
#include "libkernel/serialisation/OutSerialiserTarget.h"
#include "libkernel/serialisation/PropType.h"
#include "libkernel/serialisation/Serialisable.h"
#include "libkernel/serialisation/SerialisationStrategy.h"
#include "libkernel/serialisation/SharedSerialisable.h"
#include "libkernel/serialisation/UsedTagSet.h"
#include "libkernel/streams/OutStream.h"

#include <atomic>
#include <deque>
#include <memory>
#include <optional>
#include <ranges>
#include <type_traits>
#include <vector>

namespace Kernel {

namespace Defaults {
class DefaultBase;
}
class ClassPropertiesBase;
class DefaultTable;
struct DefaultRow;
class DelayLoadHolder;
class FileStoreCompressionHint;
class FileStoreOut;
class FileStoreOutPathGenerator;
class FragmentedRawData;
class OutSerialiserObjectList;
struct OutSerialiserClass;
struct AllocatorMalloc;
template <class Base, class Allocator>
class RawDataT;

/// A class that is saved in place, without identity: `static ClassUID GetClassUID()`, `static unsigned short
/// GetSchemaVersion()` and `void Save(OutSerialiser&) const`.
template <class T>
concept InlineSerialisable = requires(T const& value, OutSerialiser& out)
{
    {
        T::GetClassUID()
        } -> std::convertible_to<ClassUID>;
    {
        T::GetSchemaVersion()
        } -> std::convertible_to<unsigned short>;
    value.Save(out);
};

/// Writer of one property list: of a file, of an object, or of an inline class. Every value is saved under a tag that
/// is unique in its list, in any order. A value equal to the default in the class's description, or in a parent's, is
/// left out of the file; its tag still counts as used.
///
/// Every save operation first looks at the abort flag of the file store and throws AbortException when it is set, and
/// then throws SaveException with code 3 when the tag was used before or a child of this list is still open. It throws
/// SaveException with code 0 when the stream takes less than it is given, which may come later than the operation whose
/// bytes failed, but not later than Close. After any exception the save is lost. With a file store that only
/// enumerates, values do nothing and objects are walked.
///
/// Belongs to one thread, with its stream, and never outlives what it was made from.
class KERNEL_API OutSerialiser
{
public:
    /// A save that can't go on.
    class KERNEL_API SaveException : public OutStream::WriteException
    {
    public:
        enum Code : int
        {
            ShortWrite = 0, ///< The stream took fewer bytes than asked.
            TooLarge = 2,   ///< A size or count does not fit its field.
            TagOrChild = 3, ///< The tag is used already, or a child or data stream is still open.
            NoEncoding = 4, ///< An enum value or flag set has no encoding.
            Misuse = 5,     ///< A programming error, a cycle of shared objects, or too many levels.
            NoPath = 6      ///< No path could be made for a delay-load item.
        };
        SaveException(char const* source, int line, int code) : m_source(source), m_line(line), m_code(code) {}
        ~SaveException() override;
        /// Name of the source file and the line that threw; static storage.
        char const* GetSource() const { return m_source; }
        int GetLine() const { return m_line; }
        int GetCode() const { return m_code; }

    private:
        char const* m_source;
        int m_line;
        int m_code;
    };

    /// A child of @p parent, for what StartClassBeginI or StartClassArrayClassI has begun: @p description is null. The
    /// parent is left alone until the child is closed.
    OutSerialiser(OutSerialiser& parent, ClassPropertiesBase const* description);
    OutSerialiser(OutSerialiser const&) = delete;
    OutSerialiser& operator=(OutSerialiser const&) = delete;
    virtual ~OutSerialiser();

    // Scalars and strings.

    template <PropValue T>
    void SaveType(IDTag tag, T const& value)
    {
        SaveScalarI(tag, PropTypeOf<T>(), PropBits(value), sizeof(T));
    }
    template <std::same_as<bool> T>
    void SaveType(IDTag tag, T value)
    {
        SaveBoolI(tag, value);
    }
    void SaveType(IDTag tag, String8 const& text)
    {
        SaveStringI(tag, text.GetData(), static_cast<u64>(text.GetLength()));
    }
    /// Stored as UTF-8.
    void SaveType(IDTag tag, String16 const& text);
    void SaveType(IDTag tag, String32 const& text);
    void SaveType(IDTag tag, char const* text) { SaveType(tag, String8(text)); }
    /// A JSON value, stored as a string of its compact text. The including source has the JSON library's header.
    template <JsonValue T>
    void SaveType(IDTag tag, T const& value)
    {
        auto const text = value.dump();
        SaveStringI(tag, text.data(), text.size());
    }

    // Arrays.

    template <PropValue T>
    void SaveTypes(IDTag tag, T const* values, u64 count)
    {
        SaveTypeArrayI(tag, PropTypeOf<T>(), values, sizeof(T), count);
    }
    void SaveTypes(IDTag tag, bool const* values, u64 count);
    void SaveTypes(IDTag tag, std::vector<bool> const& values);
    void SaveTypes(IDTag tag, std::deque<bool> const& values);
    void SaveTypes(IDTag tag, String8 const* texts, u64 count);
    void SaveTypes(IDTag tag, String16 const* texts, u64 count);
    void SaveTypes(IDTag tag, String32 const* texts, u64 count);
    template <JsonValue T>
    void SaveTypes(IDTag tag, T const* values, u64 count)
    {
        std::vector<String8> texts;
        for (u64 i = 0; i < count; ++i) {
            auto const text = values[i].dump();
            texts.emplace_back(text.data(), CheckLengthI(text.size()));
        }
        SaveTypes(tag, texts.data(), count);
    }
    /// A vector, array or span of anything above.
    template <std::ranges::contiguous_range R>
    void SaveTypes(IDTag tag, R const& values)
    {
        SaveTypes(tag, std::ranges::data(values), std::ranges::size(values));
    }

    // Structs and blocks of bytes; their bytes go to the file as they lie.

    /// A struct of at most 65,535 bytes, with its size.
    template <class T>
    requires std::is_trivially_copyable_v<T>
    void SavePropertyStruct(IDTag tag, T const& value) { SavePropertyStructI(tag, &value, sizeof(T)); }
    template <std::ranges::contiguous_range R>
    requires std::is_trivially_copyable_v<std::ranges::range_value_t<R>>
    void SavePropertyStructs(IDTag tag, R const& values)
    {
        SavePropertyStructArrayI(tag, std::ranges::data(values), sizeof(std::ranges::range_value_t<R>),
                                 std::ranges::size(values));
    }
    /// A struct of 1 to 64 bytes, whose size is its type. Never left out.
    template <class T>
    requires std::is_trivially_copyable_v<T>
    void SaveRawStruct(IDTag tag, T const& value) { SaveRawStructI(tag, &value, sizeof(T)); }
    /// Never left out, as are the next three.
    void SaveRawData(IDTag tag, void const* bytes, u64 size);
    /// Places the bytes at a multiple of @p alignment, at most 8, in the stream that is written.
    void SaveAlignedRawData(IDTag tag, void const* bytes, u64 size, u64 alignment);
    void SaveAlignedRawData(IDTag tag, RawDataT<VoidClass, AllocatorMalloc> const& bytes, u64 alignment);
    void SaveFragmentedRawData(IDTag tag, FragmentedRawData const& bytes);

    // Enumerations and flags.

    template <class E>
    void SaveEnum(IDTag tag, EnumSerialiser const& serialiser, E value)
    {
        SaveEnumI(tag, serialiser, static_cast<int>(value));
    }
    template <std::ranges::input_range R>
    void SaveEnums(IDTag tag, EnumSerialiser const& serialiser, R const& values)
    {
        std::vector<int> numbers;
        for (auto const value : values) numbers.push_back(static_cast<int>(value));
        SaveEnumsI(tag, serialiser, numbers.data(), numbers.size());
    }
    /// An enumeration of bits, or an unsigned number.
    template <class F>
    void SaveFlagSet(IDTag tag, FlagSerialiser const& serialiser, F flags)
    {
        static_assert(sizeof(F) <= 8);
        using Word =
            std::conditional_t<sizeof(F) == 1, u8,
                               std::conditional_t<sizeof(F) == 2, u16, std::conditional_t<sizeof(F) == 4, u32, u64>>>;
        SaveFlagSetI(tag, serialiser, static_cast<Word>(flags), sizeof(F));
    }

    // Objects. A null is saved as such.

    /// @p isOwner says that the caller owns the object; of several places that refer to it only one should.
    void SaveObject(IDTag tag, NonCounted<Serialisable const> object, bool isOwner = true);
    void SaveSharedObject(IDTag tag, Consolidated<SharedSerialisable> const& object);
    /// A sized range of pointers, of any kind that gives Get() or converts.
    template <std::ranges::sized_range R>
    void SaveObjects(IDTag tag, R const& objects, bool isOwner = true)
    {
        StartObjectArrayTestI(tag);
        StartObjectArrayBeginI(tag, std::ranges::size(objects));
        auto const end = std::ranges::end(objects);
        for (auto at = std::ranges::begin(objects); at != end;) {
            NonCounted<Serialisable const> const object(*at);
            if (++at != end) PrefetchI(NonCounted<Serialisable const>(*at).Get());
            SaveObjectI(object, isOwner);
        }
    }
    /// A sized range of Consolidated.
    template <std::ranges::sized_range R>
    void SaveSharedObjects(IDTag tag, R const& objects)
    {
        StartObjectArrayTestI(tag);
        if (HasDefaultI(tag) && TestDefaultObjectsI(tag, {std::ranges::begin(objects), std::ranges::end(objects)}))
            return;
        StartObjectArrayBeginI(tag, std::ranges::size(objects));
        for (auto const& object : objects) SaveSharedObjectI(object);
    }

    // Inline classes.

    template <InlineSerialisable T>
    void SaveClass(IDTag tag, T const& value)
    {
        StartClassTestI(tag);
        StartClassBeginI(tag, T::GetClassUID(), T::GetSchemaVersion());
        SaveClassBodyI(value);
        EndPropClassI();
    }
    /// A pointer of any kind; null is saved as such.
    template <class P>
    requires InlineSerialisable<std::remove_cvref_t<decltype(*std::declval<P const&>())>>
    void SaveClass(IDTag tag, P const& pointer)
    {
        if (pointer)
            SaveClass(tag, *pointer);
        else
            SaveNullPropClassI(tag);
    }
    /// A sized range of values, or of pointers, some of which may be null.
    template <std::ranges::sized_range R>
    void SaveClasses(IDTag tag, R const& values)
    {
        using Element = std::ranges::range_value_t<R>;
        StartClassArrayTestI(tag);
        if constexpr (InlineSerialisable<Element>) {
            StartClassArrayBeginI(tag, Element::GetClassUID(), Element::GetSchemaVersion(), std::ranges::size(values));
            for (Element const& value : values) {
                StartClassArrayClassI();
                SaveClassBodyI(value);
            }
        } else {
            using T = std::remove_cvref_t<decltype(*std::declval<Element const&>())>;
            StartClassArrayBeginI(tag, T::GetClassUID(), T::GetSchemaVersion(), std::ranges::size(values));
            for (Element const& value : values) {
                if (!value) {
                    StartClassArrayClassNullI();
                    continue;
                }
                StartClassArrayClassI();
                SaveClassBodyI(*value);
            }
        }
        EndPropClassArrayI();
    }

    /// Saves a reference to an item that is loaded on demand, and hands holder and hint to the file store, which is
    /// what makes the item's own data go there. The path in this store is the holder's; a holder without one gets it
    /// from
    /// @p generator, and SaveException with code 6 says that there was none. Null is saved as such.
    void SaveDelayLoadObject(IDTag tag, Counted<DelayLoadHolder> const& holder, FileStoreOutPathGenerator& generator,
                             Counted<FileStoreCompressionHint> hint);

    // The steps that the templates are made of.

    /// Value, and its size in bytes.
    void SaveTypeI(IDTag tag, PropType type, void const* value, u64 size);
    /// Values, the size of each in bytes, and their count.
    void SaveTypeArrayI(IDTag tag, PropType type, void const* values, u64 unitSize, u64 count);
    void SaveStringI(IDTag tag, char const* utf8, u64 length);
    void SavePropertyStructI(IDTag tag, void const* value, u64 size);
    void SavePropertyStructArrayI(IDTag tag, void const* values, u64 unitSize, u64 count);
    void SaveRawStructI(IDTag tag, void const* value, u64 size);
    void SaveEnumI(IDTag tag, EnumSerialiser const& serialiser, int value);
    void SaveEnumsI(IDTag tag, EnumSerialiser const& serialiser, int const* values, u64 count);
    /// @p width is the size of the flag word in bytes.
    void SaveFlagSetI(IDTag tag, FlagSerialiser const& serialiser, u64 flags, unsigned char width);
    /// Test, then Begin, then one object for each of the count.
    void StartObjectArrayTestI(IDTag tag);
    void StartObjectArrayBeginI(IDTag tag, u64 count);
    void SaveObjectI(NonCounted<Serialisable const> object, bool isOwner);
    void SaveSharedObjectI(Consolidated<SharedSerialisable> const& object);
    /// Test, Begin, a child that is closed, End.
    void StartClassTestI(IDTag tag);
    void StartClassBeginI(IDTag tag, ClassUID const& classUID, unsigned short version);
    void EndPropClassI();
    /// Stands for all four.
    void SaveNullPropClassI(IDTag tag);
    /// Test, Begin, for each of the count either ClassNull or Class and a child that is closed, End.
    void StartClassArrayTestI(IDTag tag);
    void StartClassArrayBeginI(IDTag tag, ClassUID const& classUID, unsigned short version, u64 count);
    void StartClassArrayClassI();
    void StartClassArrayClassNullI();
    void EndPropClassArrayI();

    // State.

    /// Writes the end of the list; at file level also hands everything to the stream, which is not flushed. Code 3
    /// while a child is open. Further calls do nothing; saving afterwards is code 5.
    void Close();
    bool IsClosed() const { return (m_obstacles & Closed) != 0; }
    bool HaveChildActive() const { return (m_obstacles & ChildActive) != 0; }
    /// True if the tag was used in this list. While only enumerating, values do not count.
    bool HasProperty(IDTag tag) const;
    /// Path of the file being written, for classes that store paths relative to it; empty unless somebody set it.
    /// Children inherit it.
    String8 const& GetFilePath() const { return m_advice->path; }
    void SetFilePath(String8 const& path);
    FileStoreOut& GetFileStoreOut() const { return m_store; }
    /// False in a pass that only enumerates paths or holders.
    bool IsFullSave() const { return (m_obstacles & Enumerating) == 0; }
    /// Keeps an object that might die during the save alive until it ends: objects are told apart by address.
    void AddProlongedObject(Counted<Countable const> object);

    /// The strategies in force, the latest last. Children start with those of their parent.
    std::vector<Counted<SerialisationStrategy const>> const& GetStrategies() const { return m_advice->strategies; }
    void PushStrategy(Counted<SerialisationStrategy const> const& strategy);
    /// Takes the latest away; nothing if there is none.
    void PopStrategy();
    void InitStrategies(std::vector<Counted<SerialisationStrategy const>> const& strategies);

protected:
    /// For the file level. The references may be to members of a derived class that are not constructed yet.
    OutSerialiser(OutSerialiserTarget& target, FileStoreOut& store, OutSerialiserObjectList& objects);

    OutSerialiserTarget& m_target;
    FileStoreOut& m_store;
    OutSerialiserObjectList& m_objects;

private:
    friend class OutSerialiserPropertyDataStream;
    friend class OutSerialiserFile;
    friend class PropWriter;

    // What children inherit. A serialiser points to its parent's until it changes something.
    struct Advice
    {
        std::vector<Counted<SerialisationStrategy const>> strategies;
        String8 path;
    };
    static Advice const s_noAdvice;
    static OutSerialiserStep const s_noStep;
    Advice& GetOwnAdvice();

    [[noreturn]] void Fail(int code, SourceLocation where = SourceLocation::Current()) const;
    u8* ClaimI(u64 count);
    void PutI(void const* bytes, u64 count);
    u8* PutHeaderI(IDTag tag, u8 type, u64 more);
    u32 CheckCountI(u64 count) const;
    u16 CheckShortI(u64 size) const;
    int CheckLengthI(u64 length) const;
    // What keeps a property from being saved at once.
    enum Obstacle : u8
    {
        ChildActive = 1,
        Closed = 2,
        Enumerating = 4
    };
    OutSerialiser(OutSerialiser& parent, OutSerialiserClass& known);
    // Another thread may set the flag.
    bool IsAbortRequestedI() const
    {
        return std::atomic_ref<bool>(const_cast<bool&>(*m_abort)).load(std::memory_order_relaxed);
    }
    /// What every property begins with. Gives the default of the tag, or null.
    DefaultRow const* StartI(IDTag tag);
    DefaultRow const* StartOutOfSequenceI(IDTag tag);
    void PutRawDataI(IDTag tag, void const* bytes, u64 size);
    void PutFlagSetI(IDTag tag, u64 encoded, u16 version, u8 bytes);
    [[noreturn]] void AbortI();
    void SaveScalarI(IDTag tag, PropType type, u64 bits, u32 size)
    {
        OutSerialiserStep const* const step = m_step;
        if (step->tag != tag.value || m_obstacles || IsAbortRequestedI() || !m_target.HasRoom(c_scalarRoom))
            return SaveAnyScalarI(tag, type, bits, size);
        m_step = step + 1;
        if (step->type != type || step->value != bits) PutScalarI(tag, type, bits, size);
    }
    void SaveAnyScalarI(IDTag tag, PropType type, u64 bits, u32 size);
    // Two stores whatever the size: each runs past what counts, and what comes next covers the rest.
    static constexpr u64 c_scalarRoom = 13;
    void PutScalarI(IDTag tag, PropType type, u64 bits, u32 size)
    {
        u8* const to = m_target.Reserve(c_scalarRoom);
        StoreLittleEndian(to, u64{tag.value} << 8 | static_cast<u8>(type));
        StoreLittleEndian(to + 5, bits);
        m_target.Advance(5 + size);
    }
    void SaveBoolI(IDTag tag, bool value);
    template <class Bools>
    void SaveBoolsI(IDTag tag, Bools const& values, u64 count);
    template <class Enc>
    void SaveForeignTextsI(IDTag tag, StringT<Enc> const* texts, u64 count);
    DefaultRow const* FindDefaultI(IDTag tag) const;
    bool HasDefaultI(IDTag tag) const;
    bool TestDefaultObjectsI(IDTag tag, std::vector<Consolidated<SharedSerialisable>> const& objects) const;
    template <InlineSerialisable T>
    void SaveClassBodyI(T const& value)
    {
        OutSerialiser child(*this, nullptr);
        value.Save(child);
        child.Close();
    }
    void PrefetchI(Serialisable const* next) const;
    void PutObjectRecordI(ObjectRecord kind, u32 index);
    template <class T>
    void SaveObjectBodyI(T const& object, u32 index);
    template <class T>
    void SaveMembersI(T const& object, OutSerialiserClass& known);
    template <class T>
    void EnumerateObjectBodyI(T const& object);

    void SaveClassInfoI(ClassPropertiesBase const* description);
    void SaveDefaultI(Defaults::DefaultBase const& item);
    void SaveObjectEnumeratePathsOnlyI(Serialisable const& object);
    void SaveSharedObjectEnumeratePathsOnlyI(SharedSerialisable const& object);
    void SaveClassInfoEnumeratePathsOnlyI(ClassPropertiesBase const* description);
    String8 GetHolderPathI(Counted<DelayLoadHolder> const& holder, FileStoreOutPathGenerator& generator);

    // Where the list stands in the sequence of its class: all tags before m_step are used, and no others. Null and the
    // end of none once a tag was out of sequence; from then on m_usedTags has all.
    OutSerialiserStep const* m_step;
    OutSerialiserStep const* m_firstStep;
    bool const* const m_abort;         // Never null.
    OutSerialiserClass* const m_class; // Null at file level and in inline classes.
    Advice const* m_advice;
    std::unique_ptr<Advice> m_ownAdvice;
    u8 m_obstacles;
    bool const m_isFileLevel;
    std::optional<NestingGuard> m_level; // Of an inline class; that of an object also spans its class record.
    UsedTagSet m_usedTags;
};

/// Pushes a strategy for a scope, unless it is null.
class KERNEL_API SerialisationStrategySession
{
public:
    SerialisationStrategySession(OutSerialiser& out, Counted<SerialisationStrategy const> strategy);
    SerialisationStrategySession(SerialisationStrategySession const&) = delete;
    SerialisationStrategySession& operator=(SerialisationStrategySession const&) = delete;
    ~SerialisationStrategySession();

private:
    OutSerialiser* const m_out; // Null if nothing was pushed.
};

} // namespace Kernel
