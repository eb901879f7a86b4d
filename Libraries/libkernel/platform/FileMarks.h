#pragma once

/// Names of the extended attributes that stand for file attributes which this system does not have, for the attribute
/// calls of PlatformFile.h.
namespace Kernel::Platform {

/// Present, with any value, on a file that is hidden.
constexpr char const* c_hiddenAttribute = "hidden";

/// The sync client's own published name: a file with this mark is left alone. The value is 32 bits, not zero.
constexpr char const* c_syncIgnoreAttribute = "com.dropbox.ignored";

} // namespace Kernel::Platform
