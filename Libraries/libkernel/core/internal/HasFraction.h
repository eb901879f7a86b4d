#pragma once

#include <cmath>

namespace Kernel::DoubleTextDetail {

/// True if @p value is not a whole number but for the last places of a calculation.
inline bool HasFraction(double value)
{
    double whole;
    double const fraction = std::modf(std::fabs(value), &whole);
    return fraction > 0.5 ? fraction < 0.9999 : fraction > 0.0001;
}

} // namespace Kernel::DoubleTextDetail
