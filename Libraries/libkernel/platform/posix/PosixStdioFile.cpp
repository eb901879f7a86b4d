#include "libkernel/platform/StdioFile.h"

#include <cerrno>
#include <memory>
#include <mutex>
#include <new>
#include <unordered_map>

// The C library lets a stream be made of four functions; these pass its calls on to the table. Such a stream has no
// descriptor that fileno could give, so a map finds the handle again.
namespace Kernel::Platform {
namespace {

struct Stream
{
    FileHandle handle;
    std::FILE* file = nullptr;
};

struct Registry
{
    std::mutex mutex;
    std::unordered_map<std::FILE*, Stream*> streams;
};

// Never destroyed: a stream may be closed by another static's destructor.
Registry& GetRegistry()
{
    static Registry& registry = *new Registry;
    return registry;
}

ssize_t Answer(IoResult const& result)
{
    if (result.error) errno = result.error;
    return result.count == 0 && result.error ? -1 : static_cast<ssize_t>(result.count);
}

ssize_t ReadStream(void* cookie, char* data, size_t size)
{
    return Answer(GetFileCalls().read(static_cast<Stream*>(cookie)->handle, data, size));
}

// The C library takes 0, not -1, as the sign of a failed write here.
ssize_t WriteStream(void* cookie, char const* data, size_t size)
{
    IoResult const result = GetFileCalls().write(static_cast<Stream*>(cookie)->handle, data, size);
    if (result.error) errno = result.error;
    return static_cast<ssize_t>(result.count);
}

int SeekStream(void* cookie, off64_t* position, int whence)
{
    SeekFrom const from = whence == SEEK_SET ? SeekFrom::Start : whence == SEEK_CUR ? SeekFrom::Current : SeekFrom::End;
    u64 at = 0;
    if (int const error = GetFileCalls().seek(static_cast<Stream*>(cookie)->handle, *position, from, at)) {
        errno = error;
        return -1;
    }
    *position = static_cast<off64_t>(at);
    return 0;
}

int CloseStream(void* cookie)
{
    std::unique_ptr<Stream> const stream(static_cast<Stream*>(cookie));
    Registry& registry = GetRegistry();
    {
        std::lock_guard const lock(registry.mutex);
        registry.streams.erase(stream->file);
    }
    int const error = GetFileCalls().close(stream->handle);
    if (error) errno = error;
    return error ? -1 : 0;
}

} // namespace

std::FILE* MakeStdioFile(FileHandle handle, char const* mode, int& error)
{
    error = ENOMEM;
    std::unique_ptr<Stream> stream(new (std::nothrow) Stream{handle});
    if (!stream) return nullptr;
    std::FILE* const file = ::fopencookie(stream.get(), mode, {ReadStream, WriteStream, SeekStream, CloseStream});
    if (!file) return nullptr;
    stream->file = file;
    Registry& registry = GetRegistry();
    std::lock_guard const lock(registry.mutex);
    registry.streams[file] = stream.release();
    error = 0;
    return file;
}

FileHandle GetStdioHandle(std::FILE* file)
{
    if (!file) return c_noHandle;
    {
        Registry& registry = GetRegistry();
        std::lock_guard const lock(registry.mutex);
        auto const found = registry.streams.find(file);
        if (found != registry.streams.end()) return found->second->handle;
    }
    int const saved = errno;
    int const fd = ::fileno(file);
    errno = saved;
    return fd;
}

} // namespace Kernel::Platform
