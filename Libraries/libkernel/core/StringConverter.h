#pragma once

#include "libkernel/core/String.h"

#include <memory>
#include <vector>

namespace Kernel {

// Text in charsets that ICU knows by name. Names are matched as ICU does, without regard to case, hyphens and blanks;
// bytes that the charset has no character for become U+FFFD, and characters that it lacks its own substitute. Input
// that is UTF-8 by its charset's name is cut at the first ill-formed code point. Nothing here throws: where there is no
// memory the answer is that of failure. All functions may be called from any thread.

/// A converter from one charset to Unicode, for many texts. One thread at a time.
class KERNEL_API StringConverter
{
public:
    /// Opens the charset. For "UTF-8", and for a name that nobody knows, the bytes are taken as UTF-8.
    explicit StringConverter(String8 const& name);
    ~StringConverter();
    StringConverter(StringConverter const&) = delete;
    StringConverter& operator=(StringConverter const&) = delete;

    /// The text up to its zero byte; empty on failure.
    String8 Convert(char const* text);

private:
    void* m_converter = nullptr; // ICU's, owned; null means UTF-8.
};

/// @p text up to its zero byte, from @p charset. Empty where the charset is unknown.
KERNEL_API String8 EncodedToUtf8(char const* text, char const* charset);
KERNEL_API String16 EncodedToUtf16(char const* text, char const* charset);

/// @p text in @p charset, with four zero bytes behind it, so that it is terminated in any charset. Null where the
/// charset is unknown.
KERNEL_API std::unique_ptr<char[]> Utf8ToEncoded(String8 const& text, char const* charset);

/// @p text in @p charset without a terminator, and for each byte the index of the unit of @p text that it came from, -1
/// for a byte that came from none, such as an escape's. False, with both empty, where the charset is unknown.
KERNEL_API bool Utf16ToEncoded(std::vector<char>& bytes, std::vector<int>& sources, String16 const& text,
                               char const* charset);

/// The charset that a file, or @p size bytes, most likely has, by ICU's name; empty if none fits or the file can't be
/// read. A guess, and slow: the bytes are compared with statistics of languages.
KERNEL_API String8 IcuCharsetDetect(String8 const& path);
KERNEL_API String8 IcuCharsetDetect(std::unique_ptr<char[]> bytes, i64 size);

/// The text of a file in @p charset, with line ends made LF. Empty if the file can't be read, the charset is unknown,
/// or the text has more UTF-16 units than the file has room for by the charset's shortest character.
KERNEL_API String8 IcuLoadTextFile(String8 const& path, String8 const& charset);

} // namespace Kernel
