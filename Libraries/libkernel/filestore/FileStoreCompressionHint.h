#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/streams/CompressionPredictor.h"

namespace Kernel {

/// Advice on how to compress one file of a store. A null hint, and a hint whose class the store does not know, mean:
/// store the bytes as they are.
class KERNEL_API FileStoreCompressionHint : public Countable
{
protected:
    ~FileStoreCompressionHint() override;
};

/// Compress with Zstandard at one of three levels, behind a predictor.
class KERNEL_API FileStoreCompressionHintGeneral : public FileStoreCompressionHint
{
public:
    /// Any other number means: store the bytes as they are.
    enum CompressionLevel : u32
    {
        CompressionLevelDefault = 0, ///< The default level of ZStandardOutStream.
        CompressionLevelMin = 1,     ///< ZStandardOutStream::MinCompression().
        CompressionLevelMax = 2      ///< ZStandardOutStream::MaxCompression().
    };

    FileStoreCompressionHintGeneral() = default;
    FileStoreCompressionHintGeneral(CompressionLevel level, CompressionPredictorType type,
                                    CompressionPredictorStripingType striping)
        : m_level(level), m_type(type), m_striping(striping)
    {
    }

    CompressionLevel GetCompressionLevel() const { return m_level; }
    CompressionPredictorType GetCompressionPredictorType() const { return m_type; }
    CompressionPredictorStripingType GetCompressionPredictorStripingType() const { return m_striping; }

protected:
    ~FileStoreCompressionHintGeneral() override;

private:
    CompressionLevel const m_level = CompressionLevelDefault;
    CompressionPredictorType const m_type{};
    CompressionPredictorStripingType const m_striping{};
};

} // namespace Kernel
