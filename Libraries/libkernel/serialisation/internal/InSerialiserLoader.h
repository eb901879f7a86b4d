#pragma once

#include "libkernel/core/NestingGuard.h"
#include "libkernel/filestore/FileStoreLoadContext.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/Serialisable.h"
#include "libkernel/serialisation/SharedSerialisable.h"
#include "libkernel/serialisation/internal/InSerialiserClassInfo.h"
#include "libkernel/serialisation/internal/InSerialiserDataPool.h"
#include "libkernel/serialisation/internal/InSerialiserSource.h"
#include "libkernel/serialisation/internal/PropertyWire.h"
#include "libkernel/serialisation/internal/StoredProperty.h"

#include <map>
#include <memory>
#include <unordered_map>
#include <vector>

namespace Kernel {

/// Counts, for the report at the end of a parse, who has taken an object out of a property.
class ObjectMarker
{
public:
    void CountLoad(bool owner) { ++(owner ? m_ownerLoads : m_otherLoads); }
    bool WasLoaded() const { return m_ownerLoads + m_otherLoads > 0; }

private:
    u64 m_ownerLoads = 0;
    u64 m_otherLoads = 0;
};

/// The markers of all plain objects of a parse. Made only where a report is wanted.
class InSerialiserObjectMarkers : public Countable
{
public:
    void CountLoad(Serialisable const* object, bool owner)
    {
        if (object) m_markers[object].CountLoad(owner);
    }
    bool WasLoaded(Serialisable const* object) const
    {
        auto const at = m_markers.find(object);
        return at != m_markers.end() && at->second.WasLoaded();
    }

private:
    ~InSerialiserObjectMarkers() override = default;
    std::unordered_map<Serialisable const*, ObjectMarker> m_markers;
};

/// One parse: turns the bytes of a stream into property lists and objects.
///
/// A list is read to its end before anybody sees it. Its properties collect on one stack shared by all lists that are
/// being read, each list its own stretch on top of its owner's. An object's list stays there until its Load has run;
/// those that last longer, of inline classes and the root, move into the pool. What properties point to lies in the
/// pool too, and the pool goes back to where it stood when the object they were read for has loaded. The defaults of
/// classes go to a pool of their own, which never goes back during the parse, since a class described inside a default
/// object stays in use.
///
/// Every operation that reads answers false for a stream that is damaged or ends, all the way out. Exceptions pass
/// through; the destructor lets go of whatever was half read.
class InSerialiserLoader final : public FileStoreLoadContext
{
public:
    InSerialiserLoader(InStream& in, FileStore& store, InSerialiser::DelayLoadsBehaviour behaviour, bool checks,
                       InSerialiserFile::ProgressFunc progress, bool wantsReport);
    ~InSerialiserLoader() override;

    /// Reads the header; null if there is none. Throws FutureVersionException for a later format.
    Counted<InSerialiserFile> ReadHeader();
    /// Reads the root list into @p file and hands it the pools.
    bool ParseFile(InSerialiserFile& file);
    void ReportObjects(InSerialiserFile::EndFunc const& end) const;

    void ReportProblem(String8 const& text) override;

private:
    // An object that was read: a property of kind Object or SharedObject, which owns a reference, or None.
    using ObjectRecord = InSerialiserProperty;
    struct ClassResult
    {
        InSerialiserClassInfoBase* info = nullptr;
        bool isUnknown = false;
    };
    class ObjectList;

    // What a property holds while it is being read.
    class OwnedProperty
    {
    public:
        OwnedProperty() = default;
        OwnedProperty(OwnedProperty const&) = delete;
        ~OwnedProperty()
        {
            if (property.kind != InSerialiserProperty::Type::None) property.Release();
        }
        void Disown() { property.kind = InSerialiserProperty::Type::None; }

        InSerialiserProperty property;
    };

    // Lists and values.
    bool ParseProperties(TagBits& tags);
    bool ParseOnStack(InSerialiser& list);
    bool ParseList(InSerialiser& list);
    bool ParseProperty(InSerialiserProperty& property);
    bool ParseNumber(u8 typeByte, InSerialiserProperty& property);
    bool ParseFlat(InSerialiserProperty& property);
    bool ReadHeader(u8 typeByte, WireHeader& header);
    bool ParseText(InSerialiserProperty& property, u32 length);
    bool ParseRawData(InSerialiserProperty& property, u32 size, u32 pad);
    bool ParseFragments(InSerialiserProperty& property, u32 size, u32 blockSize);
    bool ParseDataStream(InSerialiserProperty& property);
    bool ParseClass(InSerialiserProperty& property);
    bool ParseClasses(InSerialiserProperty& property);
    bool ReadClassList(Counted<InSerialiser const>& list);
    bool ParseDelayLoad(InSerialiserProperty& property);
    void ApplyBehaviour(DelayLoadHolder& holder) const;
    Counted<InSerialiser> MakeList() const;

    // Objects and classes.
    bool ParseObject(InSerialiserProperty& property);
    bool ParseObjects(InSerialiserProperty& property);
    bool StoreObjects(InSerialiserProperty& property, InSerialiserProperty::Type kind, u32 count, size_t base);
    bool ReadObject(InSerialiserProperty& property);
    bool ReadNewObject(InSerialiserProperty& property);
    bool CreatePlain(u32 index, InSerialiserClassInfoBase const& info, InSerialiserProperty& property);
    bool CreateShared(u32 index, InSerialiserClassInfoBase const& info, InSerialiserProperty& property);
    ObjectRecord const* FindObject(u32 index) const;
    bool AddObject(u32 index, InSerialiserProperty& property, Counted<Serialisable> object);
    ObjectRecord* AddRecord(u32 index);
    bool ReadClassRecord(ClassResult& result);
    bool ReadKnownClass(ClassResult& result);
    bool ReadClassDescription(ClassResult& result);
    bool ParseDefaults(InSerialiserClassInfoBase& info);
    bool ReadParent(ClassResult& result);
    void HandleUnknown(ClassUID uid, ClassResult& result) const;
    bool ReportProgress();

    // The same without storing.
    bool SkipProperties();
    bool SkipPayload(u8 typeByte);
    bool SkipTexts();
    bool SkipDataStream();
    bool SkipObject();
    bool SkipObjects();
    bool SkipClass();
    bool SkipClasses();
    bool SkipDelayLoad();

    InSerialiserDataPool& GetPool() { return m_defaultsNesting ? *m_defaultsPool : *m_pool; }

    InSerialiserSource m_source;
    FileStore& m_store;
    InSerialiser::DelayLoadsBehaviour const m_behaviour;
    bool const m_checks;
    bool m_missingFiles = false;
    u32 m_buildIndex = 0;
    u32 m_defaultsNesting = 0; // Descriptions of classes that are open.
    InSerialiserFile::ProgressFunc const m_progress;
    Counted<InSerialiserObjectMarkers> const m_markers;

    // What follows points into the pools, so these come first.
    std::unique_ptr<InSerialiserDataPool> m_pool;
    std::unique_ptr<InSerialiserDataPool> m_defaultsPool;
    std::unordered_map<u32, Counted<InSerialiserClassInfoBase>> m_classes; // By ClassUID.
    InSerialiserClassInfoBase* m_lastClass = nullptr; // Found last: objects of one class come in runs.
    // Objects by index. A writer counts them in order of appearance, so an index below the number begun lies in the
    // vector; a stream may give any, and the map takes those.
    std::vector<ObjectRecord> m_objects;
    std::map<u32, ObjectRecord> m_strayObjects; // A tree: the stream chooses the keys.
    u32 m_objectsBegun = 0;
    std::vector<Counted<InSerialiser>> m_lists; // Of objects, one for each level that was reached.
    size_t m_listsInUse = 0;
    std::vector<InSerialiserProperty> m_stack; // Owns what its properties hold.
};

} // namespace Kernel
