#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"

#include <array>
#include <utility>
#include <vector>

namespace Kernel {

/// Number of a legacy encoding as Windows counts them: 1252, or 10000 for Macintosh Roman.
using CodePage = int;

/// One single-byte or double-byte legacy encoding of font names and old files, in both directions.
///
/// Made from a mapping file, a text of lines such as "0x80 0x20AC # EURO SIGN" with ascending codes. The files are
/// looked for in the resources directory that the host has set (FileSystem::SetResourcesDirectory), or where it has set
/// none in the library's own data directory, and there in the folder named by SetSubdirectory. Where a file is missing
/// the encoding is the identity, which reads two bytes a character, the high one first. Resources/README.md tells what
/// each file was made from, and which ones no published source gives.
///
/// Never changes once made, so one encoding may be used from any thread; the makers may be called from any thread too.
/// No operation throws: where there is no memory, texts come back empty and makers give null.
class KERNEL_API StringEncoding : public Countable
{
public:
    /// What is written for a code point that the encoding lacks.
    enum class ErrorPolicy : int
    {
        WriteFallback = 0, ///< The fallback code.
        Skip = 1,          ///< Nothing.
        Stop = 2           ///< Nothing, nor anything behind it.
    };

    static constexpr u32 c_noCode = 0xFFFF; ///< Stands on either side for what the other side has not.

    /// The encoding of a code page; the identity where no file is known for it. One object for each file, made at its
    /// first use and kept until the process ends.
    static Counted<StringEncoding> Make(CodePage codePage);
    /// The encoding of a TrueType name record on the Macintosh platform, by its script (encoding) and language numbers.
    static Counted<StringEncoding> Make(int script, int language);
    /// Two bytes a character, the high one first.
    static Counted<StringEncoding> MakeIdentity();
    /// Text strings outside of the page contents: ISO 32000-1, annex D.
    static Counted<StringEncoding> MakePdfDocEncoding();
    /// The encoding of a mapping file that the caller holds: @p size bytes at @p text, borrowed for the call. A new
    /// object with each call.
    static Counted<StringEncoding> MakeFromText(String8 const& name, char const* text, u64 size);

    /// True if a file is known for it, whether or not it is installed.
    static bool IsSupported(CodePage codePage);
    static bool IsSupported(int script, int language);
    /// The value itself if a file is known for it, otherwise 0.
    static CodePage ToCodePage(int value);

    /// Folder of the mapping files inside the resources directory, "encodings" at first. For the host, at start-up:
    /// encodings that have been made stay as they are.
    static void SetSubdirectory(String8 const& folder);
    static String8 GetSubdirectory();

    /// The file's name without its extension, or "Identity".
    String8 const& GetName() const { return m_name; }
    bool IsIdentity() const { return m_identityPrefix == c_identity; }
    /// Codes may be of one or two bytes.
    bool IsVariableLength() const { return m_isVariableLength; }
    /// The byte begins a code of two bytes.
    bool IsLeadByte(u8 byte) const { return m_leadBytes[byte]; }

    /// @p n bytes as Unicode; a negative n means up to a zero byte. Codes that the encoding lacks give U+FFFF, and a
    /// lead byte at the very end counts as a code of its own.
    String8 ToUnicode(char const* text, int n) const;
    /// The code point of a code, c_noCode if there is none.
    u32 ToUnicode(u32 code) const;
    /// The code point of the one character in @p n bytes, c_noCode if there is none: a lead byte wants n to be 2, any
    /// other byte is read alone.
    u32 ToUnicodeSingle(char const* text, int n) const;

    /// The code of a code point, the lowest where it has several; @p fallback if it has none.
    u32 FromUnicode(u32 codePoint, u32 fallback) const;
    /// Appends the codes of @p text to @p out, two bytes for a code above 255, the high one first. Ill-formed bytes
    /// count as code points without a code. False if anything had no code. The identity appends the text's own bytes.
    bool FromUnicode(std::vector<char>& out, String8 const& text, ErrorPolicy policy, u32 fallbackCode) const;
    /// Writes the code of @p codePoint to @p out, which has room for @p size bytes. Gives the bytes written, 1 or 2, or
    /// 0 if there is no room or no code.
    int FromUnicodeSingle(char* out, int size, u32 codePoint) const;

private:
    // Where the codes and code points are equal for ever; any u32 is below it.
    static constexpr u32 c_identity = 0xFFFFFFFF;

    struct FromRow
    {
        u32 codePoint;
        u32 code;
    };
    struct ToRow
    {
        u32 codePoint;
        u32 code;
    };

    explicit StringEncoding(String8 name) : m_name(std::move(name)) {}
    ~StringEncoding() override;
    template <class T, class... Args>
    friend Counted<T> MakeCounted(Args&&... args);

    static Counted<StringEncoding> Make(char const* file);
    static Counted<StringEncoding> Build(char const* file);
    bool ReadFile(char const* file);
    void ReadLines(char const* text, char const* end);
    void Complete();
    void BecomeIdentity();
    template <class Sink>
    void ForEachCodePoint(char const* text, int n, Sink sink) const;

    String8 m_name;
    std::vector<FromRow> m_fromUnicode;  // By code point, then by code. Empty in the identity.
    std::vector<ToRow> m_toUnicode;      // By code; the first 256 are the codes 0 to 255.
    u32 m_identityPrefix = 0;            // Leading rows with code equal to code point.
    std::array<bool, 256> m_leadBytes{}; // Which bytes begin a code of two.
    bool m_isVariableLength = false;
    bool m_isMultiByte = false;
};

} // namespace Kernel
