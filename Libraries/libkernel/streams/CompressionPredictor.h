#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Types.h"

namespace Kernel {

/// The element over which differences are taken. The numbers are stored in documents.
enum class CompressionPredictorType : u32
{
    None = 0,
    UnsignedChar = 1,
    UnsignedShort = 2,
    UnsignedInt = 3
};

/// Whether elements are split into planes of their bytes first. The numbers are stored in documents.
enum class CompressionPredictorStripingType : u32
{
    None = 0,
    Striping64k = 1 ///< By chunks of 64 KiB.
};

/// A running difference over little-endian elements, wrapping at their width: pixels and the like compress better as
/// differences. The last value starts at 0 and runs on from call to call, as long as the stream lives.
///
/// Bytes at the end of a call that fill no whole element stay as they are and leave the last value alone. One object
/// serves one direction of one stream. None of the operations fails.
class KERNEL_API CompressionPredictor : public Countable
{
public:
    static constexpr u64 c_stripeChunk = 65536;

    /// Null for type None and for numbers that are no type.
    static Counted<CompressionPredictor> Create(CompressionPredictorType type);

    /// Each element becomes its difference from the one before, in place.
    virtual void Encode(void* buffer, u64 byteCount) = 0;
    /// Undoes Encode, in place.
    virtual void Decode(void* buffer, u64 byteCount) = 0;

    /// Encode on the way from @p from to @p to, which are the same or do not overlap. All bytes are copied.
    virtual void EncodeTo(void* to, void const* from, u64 byteCount) = 0;
    /// Splits one chunk of c_stripeChunk bytes into planes, the most significant byte of each element first, and
    /// encodes the result as it lies there. The two must not overlap.
    virtual void StripeAndEncodeTo(void* to, void const* from) = 0;
    /// Undoes StripeAndEncodeTo for one chunk. The two must not overlap.
    virtual void DecodeAndUnstripeTo(void* to, void const* from) = 0;

protected:
    ~CompressionPredictor() override;
};

/// The predictor over elements of type @p T.
template <class T>
class KERNEL_API CompressionPredictorT : public CompressionPredictor
{
public:
    CompressionPredictorT() = default;

    void Encode(void* buffer, u64 byteCount) override;
    void Decode(void* buffer, u64 byteCount) override;
    void EncodeTo(void* to, void const* from, u64 byteCount) override;
    void StripeAndEncodeTo(void* to, void const* from) override;
    void DecodeAndUnstripeTo(void* to, void const* from) override;

protected:
    ~CompressionPredictorT() override;

private:
    T m_last = 0;
};

extern template class KERNEL_API CompressionPredictorT<unsigned char>;
extern template class KERNEL_API CompressionPredictorT<unsigned short>;
extern template class KERNEL_API CompressionPredictorT<unsigned int>;

} // namespace Kernel
