#include "FuzzTarget.h"
#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/streams/ZStandardInStream.h"
#include "libkernel/streams/ZStandardOutStream.h"
#include "libkernel/streams/ZipInStream.h"
#include "libkernel/streams/ZipOutStream.h"

#include <algorithm>
#include <cstring>
#include <vector>

namespace Kernel::Fuzz {

namespace {

struct Settings
{
    CompressionPredictorType type;
    CompressionPredictorStripingType striping;
    int level;
    u32 seed;
};

template <class Out, class In>
void RoundTrip(std::vector<u8> const& plain, Settings const& settings)
{
    Counted<MemoryInOutStream> const packed(new MemoryInOutStream);
    auto const out = Out::Create(packed, settings.type, settings.striping, settings.level);
    Numbers writes(settings.seed);
    for (u64 done = 0; done < plain.size();) {
        u64 const part = std::min(writes.Next(3u << 16), plain.size() - done);
        Require(out->WriteBlock(plain.data() + done, part) == part, "a write to memory succeeds");
        done += part;
    }
    Require(out->Finalise(), "a stream into memory can be ended");
    packed->Rewind();

    auto const in = In::Create(packed, settings.type, settings.striping, true);
    std::vector<u8> back(plain.size() + 4);
    Numbers reads(settings.seed ^ 0xFF);
    u64 done = 0;
    // Multiples of 4 bytes are whole elements of every type.
    for (u64 got = 1; got && done < back.size(); done += got)
        got = in->ReadBlock(back.data() + done, std::min<u64>(reads.Next(3u << 14) * 4, back.size() - done));
    Require(done == plain.size(), "as many bytes come back as went in");
    Require(std::equal(plain.begin(), plain.end(), back.begin()), "the same bytes come back");
}

} // namespace

} // namespace Kernel::Fuzz

// Bytes of the input: back end, predictor, striping, level, seed of the sizes, repetitions, then what is compressed.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    using namespace Kernel;
    using namespace Kernel::Fuzz;
    Input input(data, size);
    bool const zstd = input.TakeBool();
    Settings settings;
    settings.type = static_cast<CompressionPredictorType>(input.TakeBelow(4));
    settings.striping = static_cast<CompressionPredictorStripingType>(input.TakeBelow(2));
    settings.level = static_cast<int>(input.TakeBelow(24)) - 1;
    settings.seed = input.Take();
    u64 const repetitions = input.Take();
    // Striping begins at 64 KiB, which a fuzzer's inputs seldom reach by themselves.
    std::vector<u8> plain;
    for (u64 i = 0; i <= repetitions && plain.size() < 300000; ++i)
        plain.insert(plain.end(), input.GetRest(), input.GetRest() + input.GetLeft());
    if (zstd)
        RoundTrip<ZStandardOutStream, ZStandardInStream>(plain, settings);
    else
        RoundTrip<ZipOutStream, ZipInStream>(plain, settings);
    return 0;
}
