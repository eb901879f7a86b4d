#pragma once

namespace Kernel {

/// A place in the source, for errors that tell where they were raised. As a default argument Current() is the place of
/// the call. Stands in for std::source_location, which one of the compilers that the library is built with lacks.
struct SourceLocation
{
    static constexpr SourceLocation Current(char const* file = __builtin_FILE(), int line = __builtin_LINE())
    {
        return {file, line};
    }

    char const* file; ///< Lives for ever.
    int line;
};

} // namespace Kernel
