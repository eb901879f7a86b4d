#include "libkernel/core/internal/FileBytes.h"

#include "libkernel/platform/PlatformFile.h"

#include <cstring>

namespace Kernel {

std::unique_ptr<char[]> ReadFileBytes(char const* path, u64 most, u64& size)
{
    auto const& calls = Platform::GetFileCalls();
    Platform::FileHandle handle = Platform::c_noHandle;
    if (calls.open(path, {.read = true}, handle) != 0) return nullptr;
    struct Closer
    {
        Platform::FileHandle handle;
        ~Closer() { Platform::GetFileCalls().close(handle); }
    } const closer{handle};
    u64 expected = 0;
    if (calls.getSize(handle, expected) != 0) {
        u64 start = 0;
        if (calls.seek(handle, 0, Platform::SeekFrom::End, expected) != 0 ||
            calls.seek(handle, 0, Platform::SeekFrom::Start, start) != 0)
            return nullptr;
    }
    if (expected > most) return nullptr;
    std::unique_ptr<char[]> bytes(new char[expected + 4]);
    Platform::IoResult const result = calls.read(handle, bytes.get(), expected);
    if (result.error != 0) return nullptr;
    size = result.count;
    std::memset(bytes.get() + size, 0, 4);
    return bytes;
}

} // namespace Kernel
