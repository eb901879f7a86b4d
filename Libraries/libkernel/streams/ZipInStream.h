#pragma once

#include "libkernel/streams/CompressionInStream.h"

namespace Kernel {

struct InflateContext;

/// Decompresses the zlib format, RFC 1950. Data that asks for a preset dictionary counts as damaged; bytes behind the
/// end of the compressed stream are left alone.
class KERNEL_API ZipInStream : public CompressionInStream
{
public:
    /// Null without memory or without a source. @p throwOnError chooses how damage is told.
    static Counted<ZipInStream> Create(Counted<InStream> source, CompressionPredictorType type,
                                       CompressionPredictorStripingType striping, bool throwOnError);

protected:
    ~ZipInStream() override;
    bool DecompressFromBuffer(void* to, u64 count, u64& delivered) override;

private:
    ZipInStream(Counted<InStream> source, CompressionPredictorType type, CompressionPredictorStripingType striping,
                bool throwOnError);
    bool Init();

    InflateContext* m_context = nullptr;
};

} // namespace Kernel
