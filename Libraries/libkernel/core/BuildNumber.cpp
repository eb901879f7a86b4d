#include "libkernel/core/BuildNumber.h"

namespace Kernel {
namespace {

constexpr u32 c_productionIndex = 24;
constexpr u32 c_firstIndexBeyondV1 = 20;

} // namespace

u32 BuildNumber::ProductionIndex()
{
    return c_productionIndex;
}

bool BuildNumber::IsV1ProductionIndex(u32 index)
{
    return index < c_firstIndexBeyondV1;
}

} // namespace Kernel
