#pragma once

// The error numbers of the file calls, by symbolic name (ENOENT, EACCES, ENOSPC, ...). Their values differ from system
// to system, so tables name them.
#include <cerrno>
