#pragma once

#include "libkernel/core/Types.h"

#include <map>
#include <memory>
#include <string>
#include <vector>

namespace TestSupport {

/// A disk in memory, mounted at c_root, behind the table of file calls; every other path goes to the table that was in
/// place. It records what is done to it, in order, so that the states which a power cut could leave can be made. One at
/// a time; calls may come from any thread.
class MemoryDisk
{
public:
    static constexpr char const* c_root = "/ram";

    /// Names, as full paths, with the contents behind them. Contents are shared between images and never change.
    using Image = std::map<std::string, std::shared_ptr<std::string const>>;

    enum class Kind
    {
        Write,
        SetSize,
        Flush,
        Create,
        Rename,
        Unlink,
        FlushFolder
    };

    struct Step
    {
        Kind kind;
        Kernel::u64 file = 0;   ///< Number of the file, which it keeps under every name; 0 for a folder.
        Kernel::u64 offset = 0; ///< Or the new size.
        std::string data = {};
        std::string name = {}; ///< Full path; the folder's for FlushFolder.
        std::string to = {};
    };

    /// What was there when recording began, all of it safe on the device, and what was done since.
    struct Recording
    {
        std::map<std::string, Kernel::u64> names;
        std::map<Kernel::u64, std::shared_ptr<std::string const>> contents;
        std::vector<Step> steps;
    };

    MemoryDisk();
    ~MemoryDisk();
    MemoryDisk(MemoryDisk const&) = delete;
    MemoryDisk& operator=(MemoryDisk const&) = delete;

    /// Puts an image in place of what is there. No file of the disk may be open.
    void Load(Image const& image);
    /// As a program sees the disk now.
    Image GetImage() const;

    void StartRecording();
    Recording StopRecording();

    Kernel::u64 GetOpenHandles() const;
};

/// One line about a step, for messages.
std::string Describe(MemoryDisk::Step const& step);

} // namespace TestSupport
