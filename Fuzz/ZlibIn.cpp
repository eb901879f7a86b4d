#include "CompressedInput.h"
#include "libkernel/streams/ZipInStream.h"

// Bytes of the input: predictor, striping, whether damage throws, seed of the read sizes, then a zlib stream.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    Kernel::Fuzz::ReadCompressed<Kernel::ZipInStream>(data, size);
    return 0;
}
