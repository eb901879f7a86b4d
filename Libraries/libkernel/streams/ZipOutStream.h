#pragma once

#include "libkernel/streams/CompressionOutStream.h"

namespace Kernel {

struct DeflateContext;

/// Compresses into the zlib format, RFC 1950.
class KERNEL_API ZipOutStream : public CompressionOutStream
{
public:
    /// Null without memory or without a target. Levels are clamped to the range below.
    static Counted<ZipOutStream> Create(Counted<OutStream> target, CompressionPredictorType type, int level);
    /// The same at zlib's default level.
    static Counted<ZipOutStream> Create(Counted<OutStream> target, CompressionPredictorType type,
                                        CompressionPredictorStripingType striping);
    static Counted<ZipOutStream> Create(Counted<OutStream> target, CompressionPredictorType type,
                                        CompressionPredictorStripingType striping, int level);

    static int MinCompression() { return 1; }
    static int MaxCompression() { return 9; }

    /// The Adler-32 of the bytes that the compressor has taken so far, behind predictor and striping.
    u32 GetAdler32() const;

protected:
    ~ZipOutStream() override;
    bool WriteToCompressionStream(void const* from, u64 count) override;
    bool FinaliseCompressionStream() override;

private:
    ZipOutStream(Counted<OutStream> target, CompressionPredictorType type, CompressionPredictorStripingType striping);
    static Counted<ZipOutStream> CreateI(Counted<OutStream> target, CompressionPredictorType type,
                                         CompressionPredictorStripingType striping, int level);
    bool Init(int level);

    DeflateContext* m_context = nullptr;
};

} // namespace Kernel
