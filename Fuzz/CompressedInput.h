#pragma once

#include "FuzzTarget.h"
#include "libkernel/streams/CompressionInStream.h"

#include <algorithm>
#include <cstring>
#include <vector>

namespace Kernel::Fuzz {

/// Gives the bytes in pieces, as a socket does, and knows where they end.
class PieceSource : public InStream
{
public:
    PieceSource(Input const& input, u32 seed) : m_bytes(input.GetRest()), m_size(input.GetLeft()), m_numbers(seed) {}

    u64 ReadBlock(void* to, u64 count) override
    {
        u64 const part = std::min({count, m_size - m_position, m_numbers.Next(u64(1) << 18)});
        if (part) std::memcpy(to, m_bytes + m_position, part);
        m_position += part;
        return part;
    }
    bool SkipBlock(u64) override { return false; }
    u64 GetSizeInStream() const override { return m_size; }
    u64 TellInStream() const override { return m_position; }

private:
    u8 const* const m_bytes;
    u64 const m_size;
    u64 m_position = 0;
    Numbers m_numbers;
};

/// Enough for a dozen striped chunks; what unpacks to more is cut here.
constexpr u64 c_mostUnpacked = 1u << 20;

/// What comes out of a stream that is read in large steps.
struct Unpacked
{
    std::vector<u8> bytes;
    bool isRefused = false; // By an exception.
    bool isCut = false;     // There may be more.
};

inline Unpacked ReadInLargeSteps(CompressionInStream& in)
{
    constexpr u64 step = u64(1) << 16;
    Unpacked result;
    std::vector<u8> piece(step);
    try {
        while (u64 const got = in.ReadBlock(piece.data(), step)) {
            Require(got <= step, "a read gives no more than it was asked for");
            result.bytes.insert(result.bytes.end(), piece.begin(), piece.begin() + static_cast<i64>(got));
            result.isCut = result.bytes.size() >= c_mostUnpacked;
            if (result.isCut) break;
        }
    } catch (CompressionInStream::DecompressException const&) {
        result.isRefused = true;
    }
    return result;
}

/// Reads what @p expected was read from once more, in steps of any size and with skips, and compares. With
/// @p tellsDamage damage throws, so that what was not refused is whole. The call that meets damage may take good bytes
/// with it, so up to there alone are the bytes the same; and where it ends inside an element, that element is given as
/// it stands, not decoded.
inline void CompareInOddSteps(CompressionInStream& in, Unpacked const& expected, bool tellsDamage, u64 element,
                              Numbers numbers)
{
    bool const isWhole = tellsDamage && !expected.isRefused;
    u64 const size = expected.bytes.size();
    u64 const unit = isWhole ? 1 : element;
    u64 const sure = size - size % unit;
    std::vector<u8> piece;
    u64 position = 0;
    try {
        for (;;) {
            u64 const step = numbers.Next(3u << 16) * element;
            // A skip that fails does not say how far it came, so none goes beyond what is known to be there.
            if (isWhole && numbers.Next(8) == 1 && step <= size - position) {
                Require(in.SkipBlock(step), "what can be read can be skipped");
                position += step;
                continue;
            }
            piece.resize(step);
            u64 const got = in.ReadBlock(piece.data(), step);
            u64 const known = std::min(got - got % unit, sure - std::min(position, sure));
            Require(known == 0 || std::memcmp(piece.data(), expected.bytes.data() + position, known) == 0,
                    "the bytes do not depend on the sizes of the reads");
            position += got;
            if (got == 0 || position >= c_mostUnpacked) break;
        }
    } catch (CompressionInStream::DecompressException const&) {
        Require(tellsDamage && (expected.isRefused || expected.isCut), "damage is found by every way of reading");
        return;
    }
    if (!tellsDamage || expected.isCut || position >= c_mostUnpacked) return;
    Require(!expected.isRefused, "damage is found by every way of reading");
    Require(position == size, "as much can be read in small steps as in large ones");
}

/// Reads an input through a back end twice, with every predictor and striping, and compares.
template <class Stream>
void ReadCompressed(uint8_t const* data, size_t size)
{
    Input input(data, size);
    auto const type = static_cast<CompressionPredictorType>(input.TakeBelow(4));
    auto const striping = static_cast<CompressionPredictorStripingType>(input.TakeBelow(2));
    bool const throwOnError = input.TakeBool();
    u32 const seed = input.Take();
    bool const wholeElements =
        type != CompressionPredictorType::None && striping == CompressionPredictorStripingType::None;
    u64 const element = wholeElements ? u64(1) << (static_cast<u32>(type) - 1) : 1;

    auto const first = Stream::Create(new PieceSource(input, 0), type, striping, throwOnError);
    auto const second = Stream::Create(new PieceSource(input, seed), type, striping, throwOnError);
    Unpacked const expected = ReadInLargeSteps(*first);
    CompareInOddSteps(*second, expected, throwOnError, element, Numbers(seed));
}

} // namespace Kernel::Fuzz
