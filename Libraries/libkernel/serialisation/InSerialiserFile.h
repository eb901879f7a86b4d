#pragma once

#include "libkernel/serialisation/InSerialiser.h"

#include <functional>
#include <memory>
#include <vector>

namespace Kernel {

class FileStore;
class InSerialiserDataPool;
class InStream;

/// The root list of a property stream, with what its header says.
///
/// The parse operations read one stream, on the calling thread. Null: the stream is not a property stream, ends too
/// early or is damaged, or the progress function stopped the parse. FutureVersionException: a format or a property type
/// that is too new, or an object whose Load refused. UnknownClassUIDException: a class that is not registered, in a
/// parse with checks. What the stream, a Load or the store throws passes through. Nothing of a parse that failed
/// remains.
///
/// Where the stream stands after a success is exact: just behind the root list. After a failure it is anywhere. A
/// seekable stream is read in blocks and set back; any other is asked for no byte beyond the list, which is slower.
///
/// No stream can make the parse take memory that its size does not justify: a length or count beyond what is left is
/// damage, and where the stream does not know its size (it says 0) memory runs at most 1 MiB ahead of the bytes.
/// Objects, inline classes, parents of classes and defaults nested deeper than c_maxNesting are damage.
class KERNEL_API InSerialiserFile : public InSerialiser
{
public:
    /// Called once for each new object with the part of the stream that is done, 0 to 1; false stops the parse. 0 all
    /// the time where the stream does not know its size.
    using ProgressFunc = std::function<bool(float)>;
    /// Called at the end of a successful parse if there is an object that somebody's Load took and then dropped: the
    /// first list holds these, the second all other plain objects. The objects live only during the call.
    using EndFunc = std::function<void(std::vector<NonCounted<Serialisable>> const& dropped,
                                       std::vector<NonCounted<Serialisable>> const& others)>;

    /// Every class must be registered. Without a store no item that is loaded on demand can be found.
    static Counted<InSerialiserFile> ParseWithChecks(InStream& in);
    static Counted<InSerialiserFile> ParseWithChecks(InStream& in, FileStore& store, DelayLoadsBehaviour behaviour,
                                                     ProgressFunc progress, EndFunc end);
    /// An object of a class that is not registered becomes null; its properties, and the objects in them, are skipped.
    /// A reference to a skipped object from elsewhere makes the whole result null.
    static Counted<InSerialiserFile> ParseSkipUnknownClasses(InStream& in);
    static Counted<InSerialiserFile> ParseSkipUnknownClasses(InStream& in, FileStore& store,
                                                             DelayLoadsBehaviour behaviour);

    /// The kind of file, and the version that its writer gave it.
    IDTag GetFileIDTag() const { return m_fileIDTag; }
    unsigned short GetFileVersion() const { return m_fileVersion; }
    /// True if the store lacks an item that the file refers to.
    bool FoundMissingFiles() const { return m_foundMissingFiles; }

private:
    friend class InSerialiserLoader;

    InSerialiserFile(IDTag fileIDTag, unsigned short fileVersion);
    ~InSerialiserFile() override;
    static Counted<InSerialiserFile> ParseI(InStream& in, FileStore& store, DelayLoadsBehaviour behaviour, bool checks,
                                            ProgressFunc progress, EndFunc const& end);

    IDTag const m_fileIDTag;
    unsigned short const m_fileVersion;
    bool m_foundMissingFiles = false;
    // Hold what the properties point at.
    std::unique_ptr<InSerialiserDataPool> m_pool;
    std::unique_ptr<InSerialiserDataPool> m_defaultsPool;
};

} // namespace Kernel
