#include "libkernel/streams/CompressionPredictor.h"

#include "libkernel/streams/internal/PredictorKernels.h"

#include <iterator>

namespace Kernel {

static_assert(CompressionPredictor::c_stripeChunk == c_stripeChunkSize);

namespace {

template <class T>
CompressionPredictor* Make()
{
    return new CompressionPredictorT<T>;
}

// By type.
constexpr CompressionPredictor* (*c_makers[])() = {nullptr, &Make<unsigned char>, &Make<unsigned short>,
                                                   &Make<unsigned int>};

} // namespace

CompressionPredictor::~CompressionPredictor() = default;

Counted<CompressionPredictor> CompressionPredictor::Create(CompressionPredictorType type)
{
    u32 const index = static_cast<u32>(type);
    return index < std::size(c_makers) && c_makers[index] ? c_makers[index]() : nullptr;
}

template <class T>
CompressionPredictorT<T>::~CompressionPredictorT() = default;

template <class T>
void CompressionPredictorT<T>::Encode(void* buffer, u64 byteCount)
{
    EncodeTo(buffer, buffer, byteCount);
}

template <class T>
void CompressionPredictorT<T>::Decode(void* buffer, u64 byteCount)
{
    m_last = PredictorKernels<T>::Decode(static_cast<u8*>(buffer), byteCount, m_last);
}

template <class T>
void CompressionPredictorT<T>::EncodeTo(void* to, void const* from, u64 byteCount)
{
    m_last = PredictorKernels<T>::Encode(static_cast<u8*>(to), static_cast<u8 const*>(from), byteCount, m_last);
}

template <class T>
void CompressionPredictorT<T>::StripeAndEncodeTo(void* to, void const* from)
{
    m_last = PredictorKernels<T>::StripeAndEncode(static_cast<u8*>(to), static_cast<u8 const*>(from), m_last);
}

template <class T>
void CompressionPredictorT<T>::DecodeAndUnstripeTo(void* to, void const* from)
{
    m_last = PredictorKernels<T>::DecodeAndUnstripe(static_cast<u8*>(to), static_cast<u8 const*>(from), m_last);
}

template class CompressionPredictorT<unsigned char>;
template class CompressionPredictorT<unsigned short>;
template class CompressionPredictorT<unsigned int>;

} // namespace Kernel
