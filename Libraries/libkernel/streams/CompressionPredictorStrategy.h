#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/serialisation/SerialisationStrategy.h"
#include "libkernel/streams/CompressionPredictor.h"

namespace Kernel {

/// Advice that rides along with a save: how the bytes that follow are best prepared for compression. Never changes once
/// made, so any thread may hold and read it.
class KERNEL_API CompressionPredictorStrategy : public SerialisationStrategy
{
public:
    /// The given type, without striping.
    static Counted<CompressionPredictorStrategy const> Create(CompressionPredictorType type);
    /// The type for elements of @p byteSize bytes, without striping; None for a size other than 1, 2 and 4.
    static Counted<CompressionPredictorStrategy const> CreateForByteSize(int byteSize);
    /// The same with striping, except that single bytes have no planes and so get none.
    static Counted<CompressionPredictorStrategy const> CreateForByteSize64kStriped(int byteSize);

    CompressionPredictorType GetCompressionPredictorType() const { return m_type; }
    CompressionPredictorStripingType GetCompressionPredictorStripingType() const { return m_striping; }

protected:
    ~CompressionPredictorStrategy() override;

private:
    CompressionPredictorStrategy(CompressionPredictorType type, CompressionPredictorStripingType striping);

    CompressionPredictorType const m_type;
    CompressionPredictorStripingType const m_striping;
};

} // namespace Kernel
