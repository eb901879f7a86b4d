#include "libkernel/streams/CompressionPredictorStrategy.h"

namespace Kernel {

namespace {

CompressionPredictorType TypeForByteSize(int byteSize)
{
    switch (byteSize) {
    case 1: return CompressionPredictorType::UnsignedChar;
    case 2: return CompressionPredictorType::UnsignedShort;
    case 4: return CompressionPredictorType::UnsignedInt;
    default: return CompressionPredictorType::None;
    }
}

} // namespace

CompressionPredictorStrategy::CompressionPredictorStrategy(CompressionPredictorType type,
                                                           CompressionPredictorStripingType striping)
    : m_type(type), m_striping(striping)
{
}

CompressionPredictorStrategy::~CompressionPredictorStrategy() = default;

Counted<CompressionPredictorStrategy const> CompressionPredictorStrategy::Create(CompressionPredictorType type)
{
    return new CompressionPredictorStrategy(type, CompressionPredictorStripingType::None);
}

Counted<CompressionPredictorStrategy const> CompressionPredictorStrategy::CreateForByteSize(int byteSize)
{
    return Create(TypeForByteSize(byteSize));
}

Counted<CompressionPredictorStrategy const> CompressionPredictorStrategy::CreateForByteSize64kStriped(int byteSize)
{
    bool const hasPlanes = byteSize == 2 || byteSize == 4;
    return new CompressionPredictorStrategy(TypeForByteSize(byteSize),
                                            hasPlanes ? CompressionPredictorStripingType::Striping64k
                                                      : CompressionPredictorStripingType::None);
}

} // namespace Kernel
