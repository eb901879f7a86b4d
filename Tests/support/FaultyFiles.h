#pragma once

#include "libkernel/platform/Errors.h"
#include "libkernel/platform/PlatformFile.h"

#include <functional>
#include <string>
#include <vector>

namespace TestSupport {

/// Kinds of file call that a fault can be planned for. Reads and writes at an offset count with the plain ones.
enum class FileCall
{
    Open,
    Close,
    Read,
    Write,
    Seek,
    GetSize,
    SetSize,
    Flush,
    Stat, // By path or handle.
    Access,
    Rename,
    Unlink,
    MakeFolder,
    RemoveFolder,
    ReadLink,
    ListFolder,
    FlushFolder,
    SetAttributes, // Times, mode and extended attributes.
    GetAttribute,
    Count
};

struct Fault
{
    /// How much of a read or write is done before the error.
    enum class Part
    {
        Nothing,
        Half,
        AllButOne
    };

    FileCall call = FileCall::Write;
    int n = 1;            ///< The n-th such call from planning on, first is 1.
    bool forEver = false; ///< And each one after it.
    int error = 0;        ///< 0 with a Part other than Nothing is a short count without a reason.
    Part part = Part::Nothing;
    bool loseWrites = false; ///< A flush that fails so also undoes what was written since the last one, as a kernel
                             ///< that drops the pages would. Later flushes succeed.
    std::string path = {};   ///< Only calls on paths that hold this text; empty for all.
};

/// Puts a faulty table of file calls in place for its life, before the one that is in place. Without faults it only
/// counts. One at a time; calls may come from any thread.
class FaultyFiles
{
public:
    FaultyFiles();
    ~FaultyFiles();
    FaultyFiles(FaultyFiles const&) = delete;
    FaultyFiles& operator=(FaultyFiles const&) = delete;

    /// What is written by now counts as flushed.
    void Plan(Fault const& fault);
    /// Takes the faults away; what was counted stays.
    void Clear();
    /// True if a fault of the present plan has struck.
    bool HasFired() const;

    int GetCount(FileCall call) const;
    void ResetCounts();
    /// Handles opened since construction and not closed.
    int GetOpenHandles() const;

    /// Called before each call, outside any lock, with the path, empty where it isn't known.
    void SetObserver(std::function<void(FileCall, std::string const& path)> observer);
};

/// Runs @p operation with the given fault at n = 1, 2, ... until a run goes by without the fault firing; @p check is
/// called after each run with the faults off. Gives the number of runs in which it fired.
int ForEachFault(Fault fault, std::function<void(FaultyFiles&)> const& operation,
                 std::function<void(int n)> const& check, int most = 10'000);

} // namespace TestSupport
