#include "PropertyChecks.h"
#include "PropertyRepair.h"

// The form that skips unknown classes. A byte that chooses how the stream delivers, then the stream.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    using namespace Kernel;
    Fuzz::Input input(data, size);
    Test::Delivery const delivery = Test::c_deliveries[input.TakeBelow(4)];
    Fuzz::CheckProperties(Fuzz::Bytes(input.GetRest(), input.GetRest() + input.GetLeft()), false, delivery);
    return 0;
}

extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed)
{
    using namespace Kernel;
    return Fuzz::MutateAndRepair(data, size, maxSize, seed, [](u8* bytes, u64 count) {
        u64 const front = 1 + c_serialisedHeaderSize;
        if (count < front) return;
        StoreLittleEndian(bytes + 1, c_serialisedMagic);
        StoreLittleEndian(bytes + 5, c_serialisedFormatVersion);
        Fuzz::PropertyRepair(bytes + front, count - front).RepairList(0);
    });
}
