#include "PropertyChecks.h"
#include "PropertyRepair.h"

// The form that wants every class registered.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    Kernel::Fuzz::CheckDelivered(data, size, true);
    return 0;
}

extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed)
{
    return Kernel::Fuzz::MutateDelivered(data, size, maxSize, seed);
}
