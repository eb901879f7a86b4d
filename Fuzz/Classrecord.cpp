#include "PropertyChecks.h"
#include "PropertyRepair.h"

// The class record of an object, its list and what may follow it, twice: the second object finds the classes of the
// first described.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    using namespace Kernel;
    Test::PropertyBytes stream;
    stream.Header().Item(0x31, "Objt").Object(0);
    stream.bytes.insert(stream.bytes.end(), data, data + size);
    stream.U8(0).Item(0x31, "Agai").Object(0xFFFF).KnownClass("RdNo").Zeros(2);
    Fuzz::CheckProperties(stream.bytes, true, Test::Delivery::Memory);
    Fuzz::CheckProperties(stream.bytes, false, Test::Delivery::Unsized);
    return 0;
}

extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed)
{
    using namespace Kernel;
    return Fuzz::MutateAndRepair(data, size, maxSize, seed, [](u8* bytes, u64 count) {
        Fuzz::PropertyRepair repair(bytes, count);
        repair.RepairClassRecord(0);
        repair.RepairList(0);
    });
}
