#pragma once

#include "libkernel/streams/CompressionInStream.h"

struct ZSTD_DCtx_s;

namespace Kernel {

/// Where the decompressor stands in a frame. For ZStandardInStream alone.
struct ZStandardFrame
{
    u8 header[18] = {}; // As far as it was taken, then zeros.
    u64 headerTaken = 0;
    u64 delivered = 0;
};

/// Decompresses Zstandard frames, RFC 8878, one behind the other. A frame that asks for a window above 2^27 bytes
/// counts as damaged, and so does one of the formats from before that standard.
class KERNEL_API ZStandardInStream : public CompressionInStream
{
public:
    /// Null without memory or without a source. @p throwOnError chooses how damage is told.
    static Counted<ZStandardInStream> Create(Counted<InStream> source, CompressionPredictorType type,
                                             CompressionPredictorStripingType striping, bool throwOnError);

protected:
    ~ZStandardInStream() override;
    bool DecompressFromBuffer(void* to, u64 count, u64& delivered) override;

private:
    ZStandardInStream(Counted<InStream> source, CompressionPredictorType type,
                      CompressionPredictorStripingType striping, bool throwOnError);
    bool Init();

    ZSTD_DCtx_s* m_context = nullptr;
    ZStandardFrame m_frame;
};

/// Decompresses a block that lies whole in memory straight to @p to, as a ZStandardInStream would give its first
/// @p size bytes, without making a stream: no window, no copy, and the context comes from the pool. Bytes behind what
/// is needed are ignored. False, with @p to in any state, if the data is damaged or gives fewer than @p size bytes.
/// From any thread.
KERNEL_API bool ZStandardDecompressExact(void const* from, u64 fromSize, void* to, u64 size);
/// The same, and undoes predictor and striping. False also without memory for the 64 KiB that striping takes.
KERNEL_API bool ZStandardDecompressExact(void const* from, u64 fromSize, void* to, u64 size,
                                         CompressionPredictorType type, CompressionPredictorStripingType striping);

} // namespace Kernel
