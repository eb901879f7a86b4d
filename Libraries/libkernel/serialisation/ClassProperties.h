#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/String.h"
#include "libkernel/serialisation/Defaults.h"
#include "libkernel/serialisation/PropType.h"

#include <atomic>
#include <map>
#include <memory>
#include <vector>

namespace Kernel {

class InSerialiser;
class Serialisable;
class SharedSerialisable;
class DefaultTable;

/// The static description of a class that can be saved: its code, its schema version, its parent and the default values
/// of its properties. Made while the library or program loads, registered by a static Init beside it, and not changed
/// afterwards, so it is read without locks. A class `Widget` with
/// defaults writes
///
///     ClassProperties const Widget::ms_ClassProperties("Widg", &ClassProperties::CreateNew<Widget>, 1,
///                                                      Widget::__GetDefaultSerialisation(), nullptr);
///     ClassPropertiesBase::Init Widget::s_init(&Widget::ms_ClassProperties);
class KERNEL_API ClassPropertiesBase
{
public:
    using DefaultItem = Counted<Defaults::DefaultBase const>;
    using DefaultMap = std::map<IDTag, DefaultItem>;

    /// Enters a description in the registry. A null description, or a class code that is already there, stops the
    /// process: a programming error that must surface at start-up.
    class KERNEL_API Init
    {
    public:
        explicit Init(ClassPropertiesBase const* description);
    };

    ClassPropertiesBase(ClassPropertiesBase const&) = delete;
    ClassPropertiesBase& operator=(ClassPropertiesBase const&) = delete;
    virtual ~ClassPropertiesBase();
    /// True for a description of shared objects: this is then a SharedClassProperties, otherwise a ClassProperties.
    virtual bool IsSharedType() const = 0;
    /// True if objects are made by a legacy create function.
    virtual bool IsLegacy() const = 0;

    ClassUID GetClassUID() const { return m_classUID; }
    /// Null for a root.
    ClassPropertiesBase const* GetParentClassProperties() const { return m_parent; }
    unsigned short GetSchemaVersion() const { return m_schemaVersion; }
    /// This class's own defaults, in the order of the tags.
    DefaultMap const& GetDefaults() const { return m_defaults; }
    /// True if this class or one of its parents has that code.
    bool IsPolymorphicType(ClassUID classUID) const;

    /// The registered description, or null.
    static ClassPropertiesBase const* FindClassPropertiesBase(ClassUID const& classUID);
    /// Throws OutSerialiser::SaveException with code 5.
    [[noreturn]] static void InternalFailure(char const* file, int line);

    /// True if this class itself, leaving out its parents, has a default for the tag, of the kind asked about, and
    /// equal to the value.
    bool TestDefaultType(IDTag tag, PropType type, void const* value, u64 size) const;
    bool TestDefaultType(IDTag tag, String8 const& text) const;
    bool TestDefaultTypeArray(IDTag tag, PropType type, void const* values, u64 unitSize, u64 count) const;
    bool TestDefaultTypeArray(IDTag tag, bool const* values, u64 count) const;
    bool TestDefaultTypeArray(IDTag tag, std::vector<bool> const& values) const;
    bool TestDefaultStringArray(IDTag tag, String8 const* texts, u64 count) const;
    bool TestDefaultCustom(IDTag tag, void const* value, u64 size) const;
    bool TestDefaultCustomArray(IDTag tag, void const* values, u64 unitSize, u64 count) const;
    bool TestDefaultEnum(IDTag tag, unsigned short code, unsigned short version) const;
    bool TestDefaultEnumArray(IDTag tag, unsigned short const* codes, u64 count, unsigned short version) const;
    bool TestDefaultFlagSet(IDTag tag, u64 encoded, unsigned short version) const;
    bool TestDefaultSharedObject(IDTag tag, Consolidated<SharedSerialisable> const& object) const;
    bool TestDefaultSharedObjectArray(IDTag tag, std::vector<Consolidated<SharedSerialisable>> const& objects) const;

protected:
    ClassPropertiesBase(ClassUID const& classUID, unsigned short schemaVersion);
    /// @p defaults ends at a null item and may be null; a tag given twice keeps the later item. @p parent may be a
    /// static object that is not constructed yet.
    ClassPropertiesBase(ClassUID const& classUID, unsigned short schemaVersion, DefaultItem const* defaults,
                        ClassPropertiesBase const* parent);

private:
    friend class OutSerialiserObjectList;
    friend KERNEL_API void ShutdownSerialisation();

    template <class T>
    T const* FindDefaultI(IDTag tag) const;
    // The defaults of this class and its parents, made at the first save that needs them: at construction a parent may
    // not have been constructed.
    DefaultTable const& GetDefaultTable() const;
    void ClearDefaults();

    ClassUID const m_classUID;
    ClassPropertiesBase const* const m_parent;
    unsigned short const m_schemaVersion;
    DefaultMap m_defaults;
    mutable std::atomic<DefaultTable const*> m_table{nullptr}; // Owned.
};

/// Description of a class of objects with identity.
class KERNEL_API ClassProperties : public ClassPropertiesBase
{
public:
    /// Makes an empty object, which is loaded next. Null ends the parse.
    using CreateFunc = Counted<Serialisable> (*)();
    /// Makes the object from its parsed properties and the class version in the file.
    using CreateLegacyFunc = Counted<Serialisable> (*)(InSerialiser const&, unsigned short);

    ClassProperties(ClassUID const& classUID, CreateLegacyFunc create, unsigned short schemaVersion);
    /// A null @p create marks an abstract class.
    ClassProperties(ClassUID const& classUID, CreateFunc create, unsigned short schemaVersion,
                    DefaultItem const* defaults, ClassPropertiesBase const* parent);
    ~ClassProperties() override;
    bool IsSharedType() const override;
    bool IsLegacy() const override;
    CreateFunc GetCreateFunc() const { return m_create; }
    CreateLegacyFunc GetCreateLegacyFunc() const { return m_createLegacy; }

    /// The usual create function. A class with a private constructor makes ClassProperties its friend.
    template <class T>
    static Counted<Serialisable> CreateNew()
    {
        return Counted<Serialisable>(new T());
    }

private:
    CreateFunc const m_create;
    CreateLegacyFunc const m_createLegacy;
};

/// Description of a class of shared objects, with the set of their canonical copies. Any thread may consolidate, find
/// and sweep: the set has a lock of its own.
class KERNEL_API SharedClassProperties : public ClassPropertiesBase
{
public:
    using CreateFunc = Counted<SharedSerialisable> (*)();
    using CreateLegacyFunc = Counted<SharedSerialisable> (*)(InSerialiser const&, unsigned short);

    SharedClassProperties(ClassUID const& classUID, CreateLegacyFunc create, unsigned short schemaVersion);
    SharedClassProperties(ClassUID const& classUID, CreateFunc create, unsigned short schemaVersion,
                          DefaultItem const* defaults, ClassPropertiesBase const* parent);
    ~SharedClassProperties() override;
    bool IsSharedType() const override;
    bool IsLegacy() const override;
    CreateFunc GetCreateFunc() const { return m_create; }
    CreateLegacyFunc GetCreateLegacyFunc() const { return m_createLegacy; }

    /// The canonical copy of the object's value. It is @p object itself if it already was, or if the value is new; an
    /// equal copy otherwise, and then @p object is to be dropped. The object must be of this class. Null gives null.
    Consolidated<SharedSerialisable> ConsolidateObjectSacrifice(Counted<SharedSerialisable const> const& object) const;
    /// The canonical copy if there is one, or null.
    Consolidated<SharedSerialisable> FindConsolidatedObject(Counted<SharedSerialisable const> const& object) const;
    /// Lets go of the canonical copies that nobody else holds. Those may have held others; with @p untilStable it goes
    /// on until a pass lets go of none, otherwise such others wait for the next sweep.
    void Sweep(bool untilStable) const;
    /// The same over every shared class.
    static void SweepAll(bool untilStable);

    template <class T>
    static Counted<SharedSerialisable> CreateNew()
    {
        return Counted<SharedSerialisable>(new T());
    }

private:
    struct CanonicalSet;
    bool SweepOnceI() const;

    CreateFunc const m_create;
    CreateLegacyFunc const m_createLegacy;
    std::unique_ptr<CanonicalSet> const m_set;
};

/// The canonical copy of a new object of class @p T.
template <class T>
Consolidated<T> Consolidate(Counted<T> const& object)
{
    if (!object) return {};
    auto const canonical = object->GetObjectClassProperties()->ConsolidateObjectSacrifice(object);
    return Consolidated<T>::Trust(Counted<T>(static_cast<T*>(dynamic_cast<std::remove_const_t<T>*>(canonical.Get()))));
}

/// Empties the defaults of every registered class: they hold objects and strings that must go before the allocator
/// does. For the end of the process; nothing can be saved or loaded after it.
KERNEL_API void ShutdownSerialisation();

} // namespace Kernel
