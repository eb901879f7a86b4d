#pragma once

#include <cstdlib>

namespace KernelTest {

/// True in the long mode of the test run (`Scripts/test --long`), in which the exhaustive tests leave nothing out.
inline bool IsLongRun()
{
    char const* const value = std::getenv("KERNEL_LONG_TESTS");
    return value && *value && *value != '0';
}

} // namespace KernelTest
