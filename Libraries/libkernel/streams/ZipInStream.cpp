#include "libkernel/streams/ZipInStream.h"

#include "libkernel/streams/internal/CodecPools.h"

#include <algorithm>
#include <new>

namespace Kernel {

namespace {

constexpr u64 c_maxPiece = 1u << 30; // zlib counts in 32 bits.

} // namespace

ZipInStream::ZipInStream(Counted<InStream> source, CompressionPredictorType type,
                         CompressionPredictorStripingType striping, bool throwOnError)
    : CompressionInStream(std::move(source), type, striping, throwOnError)
{
}

ZipInStream::~ZipInStream()
{
    GiveInflate(m_context);
}

Counted<ZipInStream> ZipInStream::Create(Counted<InStream> source, CompressionPredictorType type,
                                         CompressionPredictorStripingType striping, bool throwOnError)
try {
    Counted<ZipInStream> stream(new ZipInStream(std::move(source), type, striping, throwOnError));
    return stream->Init() ? stream : nullptr;
} catch (std::bad_alloc const&) {
    return nullptr;
}

bool ZipInStream::Init()
{
    m_context = TakeInflate();
    return m_context && InitBlocks();
}

bool ZipInStream::DecompressFromBuffer(void* to, u64 count, u64& delivered)
{
    z_stream& z = m_context->stream;
    uInt const input = static_cast<uInt>(GetInputLeft());
    uInt const room = static_cast<uInt>(std::min(count, c_maxPiece));
    z.next_in = const_cast<u8*>(GetInput()); // Read only; the interface is older than const.
    z.avail_in = input;
    z.next_out = static_cast<u8*>(to);
    z.avail_out = room;
    int const result = inflate(&z, Z_NO_FLUSH);
    if (result == Z_MEM_ERROR) SetLacksMemory();
    UseInput(input - z.avail_in);
    bool const good = result == Z_OK || result == Z_STREAM_END;
    delivered = good ? room - z.avail_out : 0;
    return good;
}

} // namespace Kernel
