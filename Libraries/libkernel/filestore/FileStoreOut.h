#pragma once

#include "libkernel/concurrency/CriticalSection.h"
#include "libkernel/core/Abortable.h"
#include "libkernel/core/String.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filestore/FileStoreCompressionHint.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/filestore/FileStorePostSaveInterface.h"
#include "libkernel/serialisation/SerialisationStrategy.h"

#include <atomic>
#include <vector>

namespace Kernel {

class FileStore;

/// What a Save writes files into. Several threads may offer files; strategies are added before the save starts.
///
/// A class that overrides some of the CreateFile forms names the others with a using declaration.
class KERNEL_API FileStoreOut
{
public:
    enum Purpose : u32
    {
        PurposeSave = 0,             ///< A real save.
        PurposeEnumeratePaths = 1,   ///< Only the paths are wanted; no data reaches any store.
        PurposeEnumerateHolders = 2, ///< Only the holders are wanted.
    };

    /// The fixed parts of a generated path; a count stands between them.
    struct IndexedPathParts
    {
        String8 prefix;
        String8 suffix;
        friend bool operator==(IndexedPathParts const& a, IndexedPathParts const& b) = default;
        friend std::strong_ordering operator<=>(IndexedPathParts const& a, IndexedPathParts const& b) = default;
    };

    virtual ~FileStoreOut();

    /// Offers the holder's item as a file. The forms without a hint pass a null hint on; a null hint means: store the
    /// bytes as they are.
    virtual void CreateFile(Counted<DelayLoadHolder> holder, Counted<FileStoreCompressionHint> const& hint) = 0;
    virtual void CreateFile(Counted<DelayLoadHolder> holder);
    /// Offers an item as the file at @p path.
    virtual void CreateFile(String8 const& path, Counted<FileStoreItem const> const& item,
                            Counted<FileStoreCompressionHint> const& hint) = 0;
    virtual void CreateFile(String8 const& path, Counted<FileStoreItem const> const& item);
    virtual void DeleteFile(String8 const& path) = 0;
    /// Has the object's state for the store set when the save has become final.
    virtual void AddObjectToClean(Counted<FileStoreStateObject> object) = 0;
    virtual void AddPostSaveObject(Counted<FileStorePostSaveInterface> object) = 0;
    /// Makes a path that the store has not used. One object keeps its path for the whole save. False if none was made.
    virtual bool GenerateIndexedPath(IndexedPathParts const& parts, NonCounted<FileStoreItem const> item,
                                     NonCounted<DelayLoadHolder const> holder, String8& path) = 0;
    virtual void AssignDelayLoadHolderPath(Counted<DelayLoadHolder> holder, String8 const& path) = 0;
    /// The store that is being written.
    virtual FileStore& GetFileStore() const = 0;

    Purpose GetPurpose() const { return m_purpose; }
    bool IsFullSave() const { return m_purpose == PurposeSave; }

    /// The flag, which another thread may set; null if none was given.
    bool const* GetAbortFlag() const { return m_abort; }
    /// True if an abort flag was given and is set. Reads it atomically, since another thread sets it.
    bool IsAbortRequested() const { return m_abort && IsAbortFlagSet(m_abort); }
    /// Throws AbortException if the abort flag is set. Sets nothing: who gives the save up calls SetAborted.
    void TestAbort() const;
    bool WasAborted() const { return m_aborted.load(std::memory_order_acquire); }
    void SetAborted() { m_aborted.store(true, std::memory_order_release); }

    /// Advice for the whole save; null is ignored.
    void AddStrategy(Counted<SerialisationStrategy const> strategy);
    std::vector<Counted<SerialisationStrategy const>> const& GetStrategies() const { return m_strategies; }

    /// Keeps @p object alive until the save ends, so that its address is not used again. False if this output is shared
    /// by the whole process and never ends: the caller then keeps the object.
    bool AddProlongedObject(Counted<Countable const> object);

protected:
    /// Whether AddProlongedObject keeps what it is given.
    enum class Lifetime
    {
        OneSave,
        Process
    };

    /// @p abort is borrowed for the life of this object and may be null.
    explicit FileStoreOut(Purpose purpose, bool const* abort = nullptr, Lifetime lifetime = Lifetime::OneSave);
    /// An enumeration started from a save: takes its strategies and its abort flag.
    FileStoreOut(FileStoreOut const& o, Purpose purpose);
    FileStoreOut(FileStoreOut const&) = delete;
    FileStoreOut& operator=(FileStoreOut const&) = delete;

private:
    std::vector<Counted<SerialisationStrategy const>> m_strategies;
    CriticalSectionSpin m_prolongedLock;
    std::vector<Counted<Countable const>> m_prolonged; // Guarded by m_prolongedLock.
    Purpose const m_purpose;
    bool const* const m_abort;
    std::atomic<bool> m_aborted{false};
    Lifetime const m_lifetime;
};

} // namespace Kernel
