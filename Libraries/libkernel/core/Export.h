#pragma once

// KERNEL_API marks what leaves the shared object; all else is hidden.
#if defined(KERNEL_STATIC)
#define KERNEL_API
#else
#define KERNEL_API __attribute__((visibility("default")))
#endif
