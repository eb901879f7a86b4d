#include "libkernel/streams/internal/GenericCopy.h"

#include "libkernel/core/Exception.h"
#include "libkernel/core/Limits.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"
#include "libkernel/streams/StreamCopyProgress.h"

#include <cstdlib>
#include <memory>

namespace Kernel {

namespace {

struct FreeDeleter
{
    void operator()(void* p) const { std::free(p); }
};

} // namespace

bool GenericCopy(InStream& in, OutStream& out, StreamCopyProgress* progress)
{
    std::unique_ptr<void, FreeDeleter> const buffer(std::malloc(c_copyBufferSize));
    if (!buffer) throw MemoryException();

    u64 done = 0;
    u64 total = 0;
    if (progress) {
        // A source that does not know its size answers 0, which must not wrap below its position.
        u64 const size = in.GetSizeInStream();
        u64 const position = in.TellInStream();
        total = size > position ? size - position : 0;
        progress->ReportProgress(0, total);
    }
    while (u64 const read = in.ReadBlock(buffer.get(), c_copyBufferSize)) {
        if (out.WriteBlock(buffer.get(), read) != read) return false;
        done += read;
        if (progress) progress->ReportProgress(done, total);
    }
    return in.EOS();
}

bool CopyFromFile(InStream& file, OutStream& out, StreamCopyProgress* progress)
{
    return out.WillDelegateCopyFromStream() ? GenericCopy(file, out, progress) : out.CopyFromStream(file, progress);
}

bool CopyToFile(InStream& in, OutStream& file, StreamCopyProgress* progress)
{
    return in.WillDelegateCopyToStream() ? GenericCopy(in, file, progress) : in.CopyToStream(file, progress);
}

} // namespace Kernel
