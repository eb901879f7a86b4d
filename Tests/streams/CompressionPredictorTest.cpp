#include "libkernel/streams/CompressionPredictor.h"

#include "libkernel/streams/CompressionPredictorStrategy.h"
#include "libkernel/streams/internal/PredictorKernels.h"
#include "support/CompressionFixture.h"

#include <gtest/gtest.h>

namespace Kernel {
namespace {

using Testing::Bytes;

Counted<CompressionPredictor> Make(u32 type)
{
    return CompressionPredictor::Create(static_cast<CompressionPredictorType>(type));
}

TEST(CompressionPredictorTest, DifferencesWorkedByHand)
{
    struct Case
    {
        u32 type;
        Bytes plain, encoded;
    };
    for (Case const& c :
         {Case{1, {5, 7, 4, 255, 0}, {5, 2, 253, 251, 1}},
          Case{2, {0x34, 0x12, 0x35, 0x12, 0x00, 0x00, 0x77}, {0x34, 0x12, 1, 0, 0xCB, 0xED, 0x77}},
          Case{3, {1, 0, 0, 0x80, 0, 0, 0, 0, 9, 8, 7}, {1, 0, 0, 0x80, 0xFF, 0xFF, 0xFF, 0x7F, 9, 8, 7}}})
    {
        SCOPED_TRACE(c.type);
        Bytes work = c.plain;
        Make(c.type)->Encode(work.data(), work.size());
        EXPECT_EQ(work, c.encoded);
        Make(c.type)->Decode(work.data(), work.size());
        EXPECT_EQ(work, c.plain);

        // In two calls the last value runs on, and the odd bytes of the first do not touch it.
        Bytes const plain = Testing::MakePixels(103, c.type);
        for (u64 length = 0; length < 100; ++length) {
            u64 const whole = length / 4 * 4;
            Bytes expected = Testing::TransformSlowly(plain, c.type, false), copied(plain.size());
            Counted<CompressionPredictor> const encoder = Make(c.type), decoder = Make(c.type);
            encoder->EncodeTo(copied.data(), plain.data(), whole);
            encoder->EncodeTo(copied.data() + whole, plain.data() + whole, plain.size() - whole);
            ASSERT_EQ(copied, expected) << length;
            decoder->Decode(copied.data(), whole);
            decoder->Decode(copied.data() + whole, plain.size() - whole);
            ASSERT_EQ(copied, plain) << length;
        }
    }
    for (u32 type : {0u, 4u, 0xFFFFFFFFu}) EXPECT_FALSE(Make(type));
}

TEST(CompressionPredictorTest, PlanesWorkedByHand)
{
    Bytes plain(65536), striped(65536);
    Bytes const pixel{0x44, 0x33, 0x22, 0x11}; // Four planes, each of one value.
    for (u64 i = 0; i < plain.size(); ++i) plain[i] = pixel[i % 4];
    Make(3)->StripeAndEncodeTo(striped.data(), plain.data());
    Bytes expected(65536);
    for (u64 plane = 0; plane < 4; ++plane)
        std::fill_n(expected.begin() + static_cast<i64>(plane) * 16384, 4, u8(0x11));
    EXPECT_EQ(striped, expected); // 0x11111111 at the start of each plane: it is so much above the last.
}

template <class T>
void ExpectScalarAgrees()
{
    Bytes const plain = Testing::MakePixels(65536 + 4, sizeof(T));
    u8 const* const from = plain.data() + 3; // Not aligned.
    Bytes fast(65536), slow(65536), back(65536);
    T const start = static_cast<T>(0x89ABCDEF);
    T const fastLast = PredictorKernels<T>::StripeAndEncode(fast.data(), from, start);
    EXPECT_EQ(PredictorScalar<T>::StripeAndEncode(slow.data(), from, start), fastLast);
    EXPECT_EQ(fast, slow);
    EXPECT_EQ(PredictorKernels<T>::DecodeAndUnstripe(back.data(), fast.data(), start), fastLast);
    EXPECT_TRUE(std::equal(back.begin(), back.end(), from));
    EXPECT_EQ(PredictorScalar<T>::DecodeAndUnstripe(back.data(), fast.data(), start), fastLast);
    EXPECT_TRUE(std::equal(back.begin(), back.end(), from));
    for (u64 length : {u64(0), u64(15), u64(16), u64(65535)}) {
        Bytes a(length), b(length);
        EXPECT_EQ(PredictorKernels<T>::Encode(a.data(), from, length, start),
                  PredictorScalar<T>::Encode(b.data(), from, length, start));
        EXPECT_EQ(a, b);
        EXPECT_EQ(PredictorKernels<T>::Decode(a.data(), length, start),
                  PredictorScalar<T>::Decode(b.data(), length, start));
        EXPECT_EQ(a, b);
    }
}

TEST(CompressionPredictorTest, VectorAndScalarFormsGiveTheSameBytes)
{
    ExpectScalarAgrees<u8>();
    ExpectScalarAgrees<u16>();
    ExpectScalarAgrees<u32>();
}

TEST(CompressionPredictorStrategyTest, TypesBySizeOfElement)
{
    struct Case
    {
        int size;
        u32 type, striping;
    };
    for (Case const& c :
         {Case{1, 1, 0}, Case{2, 2, 1}, Case{4, 3, 1}, Case{0, 0, 0}, Case{3, 0, 0}, Case{8, 0, 0}, Case{-1, 0, 0}})
    {
        SCOPED_TRACE(c.size);
        auto const plain = CompressionPredictorStrategy::CreateForByteSize(c.size);
        auto const striped = CompressionPredictorStrategy::CreateForByteSize64kStriped(c.size);
        EXPECT_EQ(static_cast<u32>(plain->GetCompressionPredictorType()), c.type);
        EXPECT_EQ(static_cast<u32>(plain->GetCompressionPredictorStripingType()), 0u);
        EXPECT_EQ(static_cast<u32>(striped->GetCompressionPredictorType()), c.type);
        EXPECT_EQ(static_cast<u32>(striped->GetCompressionPredictorStripingType()), c.striping);
    }
}

} // namespace
} // namespace Kernel
