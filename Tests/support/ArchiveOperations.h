#pragma once

#include "support/ArchiveFixture.h"
#include "support/MemoryDisk.h"

#include <functional>
#include <map>
#include <string>
#include <vector>

namespace KernelTest {

/// What one operation works on and leaves behind. Made for each run.
struct World
{
    Counted<Archive> archive;
    Counted<Archive> other;
    Counted<BytesItem> item; ///< What a save is to write; null where nothing is saved.
    bool abort = false;      ///< What the operation gets as its abort flag.
};

/// What an operation finds on the disk.
enum class StartState
{
    Nothing,
    Document, ///< "/ram/doc": three revisions and thumbnails.
    Pair,     ///< The same with a scratch file, "/ram/scratch", that has a revision.
    Alone,    ///< "/ram/scratch", the scratch file of no master.
    Damaged,  ///< The document with a smashed info block.
    Settings  ///< "/ram/settings", written by SerialiseToFile.
};

/// One thing that a program does with documents.
struct ArchiveOperation
{
    char const* name;
    StartState start;
    std::function<void(World&)> prepare;    ///< May not fail.
    std::function<std::string(World&)> run; ///< Gives "ok" or what went wrong; may throw.
    std::string failures; ///< The results that may stand for "ok", commas between: "open *" is any, "open 1 2" two.
};

std::vector<ArchiveOperation> const& GetArchiveOperations();

/// Runs an operation, and names what it throws.
std::string RunOperation(ArchiveOperation const& operation, World& world);

/// True if the result is "ok" or among those that the operation names.
bool IsNamed(ArchiveOperation const& operation, std::string const& result);

/// Mounts a disk with the folders for temporaries, and makes the states that operations start from.
class OperationDisk
{
public:
    OperationDisk();
    ~OperationDisk();
    OperationDisk(OperationDisk const&) = delete;
    OperationDisk& operator=(OperationDisk const&) = delete;

    TestSupport::MemoryDisk& GetDisk() { return m_disk; }
    void Load(StartState state) { m_disk.Load(m_starts.at(state)); }

private:
    TestSupport::MemoryDisk m_disk;
    std::map<StartState, TestSupport::MemoryDisk::Image> m_starts;
};

/// What a person finds under one name.
struct PathView
{
    int result = 0; ///< Of opening it.
    std::map<std::string, std::string> items;
    std::string bytes;      ///< Of a file that is no document.
    bool recovered = false; ///< It took a search.

    bool operator==(PathView const& o) const { return result == o.result && items == o.items && bytes == o.bytes; }
};
using DiskView = std::map<std::string, PathView>;

/// Opens each name that operations use, for reading only, and recovers what has to be.
DiskView LookAtDisk(TestSupport::MemoryDisk& disk);

/// True if a document with these items stands whole under a temporary's or a backup's name.
bool HasCopy(TestSupport::MemoryDisk& disk, PathView const& of);

/// Empty, or what is wrong: each name must show what it showed before or what it shows after the operation, and only
/// the latter if @p succeeded. A file that was being made may also be rubbish, and a scratch file of no use where its
/// master has moved on.
std::string CompareViews(DiskView const& found, DiskView const& before, DiskView const& after, bool succeeded);

} // namespace KernelTest
