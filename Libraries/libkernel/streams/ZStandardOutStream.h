#pragma once

#include "libkernel/streams/CompressionOutStream.h"

struct ZSTD_CCtx_s;

namespace Kernel {

/// Compresses into a Zstandard frame, RFC 8878, without content size and checksum.
///
/// Hosts that call the ZSTD_ interface themselves include <zstd.h> and get it through this library: it links the one
/// that it uses publicly, so there is a single copy in the process.
class KERNEL_API ZStandardOutStream : public CompressionOutStream
{
public:
    static constexpr int c_defaultLevel = 3;

    /// Null without memory or without a target. Levels are clamped to the range below.
    static Counted<ZStandardOutStream> Create(Counted<OutStream> target, CompressionPredictorType type, int level);
    /// The same at c_defaultLevel.
    static Counted<ZStandardOutStream> Create(Counted<OutStream> target, CompressionPredictorType type,
                                              CompressionPredictorStripingType striping);
    static Counted<ZStandardOutStream> Create(Counted<OutStream> target, CompressionPredictorType type,
                                              CompressionPredictorStripingType striping, int level);

    static int MinCompression() { return 1; }
    static int MaxCompression() { return 19; }

protected:
    ~ZStandardOutStream() override;
    bool WriteToCompressionStream(void const* from, u64 count) override;
    bool FinaliseCompressionStream() override;

private:
    ZStandardOutStream(Counted<OutStream> target, CompressionPredictorType type,
                       CompressionPredictorStripingType striping);
    bool Init(int level);

    ZSTD_CCtx_s* m_context = nullptr;
};

} // namespace Kernel
