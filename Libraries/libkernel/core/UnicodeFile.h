#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/String.h"

namespace Kernel {

/// The encodings that a text file shows by its byte order mark (The Unicode Standard, section 23.8), and the same
/// without their marks.
enum class UnicodeEncoding : int
{
    None = 0, ///< No mark found; read as UTF-8.
    Utf8WithMark = 1,
    Utf16LittleEndianWithMark = 2,
    Utf16BigEndianWithMark = 3,
    Utf32LittleEndianWithMark = 4,
    Utf32BigEndianWithMark = 5,
    Utf8 = 6,
    Utf16LittleEndian = 7,
    Utf16BigEndian = 8,
    Utf32LittleEndian = 9,
    Utf32BigEndian = 10
};

/// The mark at the start of @p size bytes; None if there is none or it is cut short. FF FE 00 00 is read as the mark of
/// UTF-32.
KERNEL_API UnicodeEncoding GetByteOrderMark(u8 const* text, i64 size);

/// @p size bytes in @p encoding as UTF-8. A mark that the encoding promises is left out; a text that ends inside a
/// character or holds an ill-formed one is cut there, and without @p allowZero at the first zero character. Empty for a
/// size below 1, another encoding, or a text of more than 2^31 units.
KERNEL_API String8 ConvertToUtf8(UnicodeEncoding encoding, u8 const* text, i64 size, bool allowZero);

/// A text file as UTF-8, by its mark, or as UTF-8 without one. Empty on failure; only regular files are read, so that
/// no pipe is waited for and no device is read without end.
KERNEL_API String8 LoadAsUtf8(String8 const& path, bool allowZero);

} // namespace Kernel
