#include "CompressedInput.h"
#include "libkernel/streams/ZStandardInStream.h"

// Bytes of the input: predictor, striping, whether damage throws, seed of the read sizes, then Zstandard frames.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    Kernel::Fuzz::ReadCompressed<Kernel::ZStandardInStream>(data, size);
    return 0;
}
