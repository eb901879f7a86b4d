#pragma once

#include "libkernel/core/Types.h"

#include <string>

namespace TestSupport {

/// Records what is done to the files of one folder (not of folders in it), and makes the images that a power cut could
/// have left after any step.
///
/// The model: a write or change of size behind the last device flush of its file may be lost or kept, each by itself,
/// in program order; a kept write may stop at any byte if it is up to 64 bytes long, else at a border of 512 bytes in
/// the file. A name made, renamed or removed behind the last flush of the folder may be lost or kept; a rename is never
/// half done. One at a time; passes on to the table of file calls that was in place.
class CrashRecorder
{
public:
    /// Takes what lies in the folder as safely on the device.
    explicit CrashRecorder(std::string const& folder);
    ~CrashRecorder();
    CrashRecorder(CrashRecorder const&) = delete;
    CrashRecorder& operator=(CrashRecorder const&) = delete;

    /// Steps recorded so far: writes, flushes, changes of names.
    Kernel::u64 GetStepCount() const;
    /// What a step was, for messages.
    std::string Describe(Kernel::u64 step) const;

    static constexpr Kernel::u64 c_loseAll = 0;   ///< Nothing survives that was not flushed.
    static constexpr Kernel::u64 c_keepAll = 1;   ///< Everything does.
    static constexpr Kernel::u64 c_namesOnly = 2; ///< Every change of names does, and nothing else.

    /// Writes into @p target, an existing empty folder, the files after a cut behind the first @p steps steps. The seed
    /// is one of the three above, or chooses at random what survives.
    void MakeImage(Kernel::u64 steps, Kernel::u64 seed, std::string const& target) const;
};

} // namespace TestSupport
