#include "PropertyChecks.h"
#include "PropertyRepair.h"

// What stands in a data stream behind its version, and what may follow it.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    using namespace Kernel;
    Test::PropertyBytes stream;
    stream.Header().Item(0x30, "Strm").U16(1);
    stream.bytes.insert(stream.bytes.end(), data, data + size);
    Fuzz::CheckProperties(stream.Zeros(2).bytes, true, Test::Delivery::Memory);
    return 0;
}

extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed)
{
    using namespace Kernel;
    return Fuzz::MutateAndRepair(data, size, maxSize, seed,
                                 [](u8* bytes, u64 count) { Fuzz::PropertyRepair(bytes, count).RepairStream(); });
}
