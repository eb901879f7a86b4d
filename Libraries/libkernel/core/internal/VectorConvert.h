#pragma once

#include "libkernel/core/Types.h"

namespace Kernel {

// Steps of ConvertEnc in wide registers. They move both positions on over well-formed text, each write within the
// target's end, and stop where a code point lies beyond the basic plane or where little is left on one side. False,
// with nothing done, where the processor lacks what they need. In ill-formed text they may write other ill-formed text
// than the plain road.

/// Units on each side below which the steps stop.
constexpr int c_vectorRoom = 32;

bool ConvertInVectors(char16_t*& to, char16_t const* toEnd, char const*& from, char const* fromEnd);
bool ConvertInVectors(char*& to, char const* toEnd, char16_t const*& from, char16_t const* fromEnd);

/// Copies units from the start as long as they are ASCII; gives how many. Units of the target behind those, up to
/// @p n, are undefined.
int CopyAsciiRun(char16_t* to, char const* from, int n);
int CopyAsciiRun(char* to, char16_t const* from, int n);

/// True if all @p n units are ASCII.
bool IsAsciiRun(char const* from, int n);
bool IsAsciiRun(char16_t const* from, int n);

} // namespace Kernel
