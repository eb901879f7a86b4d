#pragma once

#include "libkernel/core/String.h"
#include "libkernel/core/Types.h"

namespace Kernel {

/// One path grammar over units of one type: pure text, no file is looked at. Rules is PathRulesDos or PathRulesUnix,
/// Unit is char (UTF-8) or char16_t. Use it through PathTraitsDos and PathTraitsUnix.
///
/// Paths are terminated with 0; lengths are in units, without the terminator. Case is compared for ASCII letters only,
/// and "letter" means an ASCII letter. All operations may be called from any thread.
///
/// The root of a path. Dos: after two backslashes all up to and including the next backslash; a letter and a colon,
/// with the separator that may follow; one separator. Unix: "/" or "~/".
template <class Rules, class Unit>
class KERNEL_API PathGrammarT
{
public:
    static bool IsSeparator(int unit);

    /// True for null, for an empty path and for a path without a root.
    static bool IsRelative(Unit const* path);

    /// True if the path begins with a root; null does not.
    static bool IsRoot(Unit const* path);

    /// True if both begin with the same drive letter, or both with a separator.
    static bool IsSameRoot(Unit const* a, Unit const* b);

    /// Dos: not null or empty, no unit below 32, none of " * < > ? |, a colon only at index 1 behind a letter, and no
    /// two separators in a row but a double backslash at the very start. Unix: not null or empty.
    static bool IsValidPath(Unit const* path);

    /// Length of the part up to and including the last separator before the first difference; a colon at index 1 of a
    /// Dos path ends a part as well. Case makes no difference, nor does the kind of separator. Null gives 0.
    static int CommonPrefixLength(Unit const* a, Unit const* b);

    /// Joins @p tail to the path of @p length units in @p buffer, with exactly one separator between them, and gives
    /// the new length. An empty path takes the tail as it stands. @p capacity counts the terminator.
    /// Throws InvalidArgException, with the buffer unchanged, for a null buffer, a null or empty tail, a negative
    /// length, and a result that does not fit.
    static int Append(Unit* buffer, Unit const* tail, int capacity, int length, int tailLength);

    /// Writes to @p out the root of @p a, and behind it the elements of @p a and then those of @p b as Canonicalize
    /// leaves them, so that ".." in b takes elements of a. A @p b that has a root is ignored. Gives the length.
    /// Throws InvalidArgException for null and for a result that does not fit in @p capacity, terminator included.
    /// @p out may be one of the inputs.
    static int Combine(Unit* out, int capacity, Unit const* a, int aLength, Unit const* b, int bLength);

    /// Brings the path into its shortest form in place and gives the new length, which is never longer; the buffer has
    /// room for length + 1 units. Empty elements and "." go; ".." takes the element before it, disappears at the root
    /// of a rooted path, and stays where a relative path has nothing left to take. Separators become the default one,
    /// one at the end goes unless it is the root's. A path without separator is left as it is. A Dos path of the form
    /// "\\server\share" keeps both names.
    static int Canonicalize(Unit* path, int length);

    /// The same from @p in to @p out, which has room for length + 1 units; @p length goes in and out. False when ".."
    /// would climb above the root of a rooted path; @p out then holds what Canonicalize gives.
    static bool CanonicalizeSafe(Unit* out, Unit const* in, int& length);
};

struct PathRulesDos;
struct PathRulesUnix;

extern template class KERNEL_API PathGrammarT<PathRulesDos, char>;
extern template class KERNEL_API PathGrammarT<PathRulesDos, char16_t>;
extern template class KERNEL_API PathGrammarT<PathRulesUnix, char>;
extern template class KERNEL_API PathGrammarT<PathRulesUnix, char16_t>;

/// Paths with drives, shares and two separators. The inherited operations take UTF-8; Wide has them for UTF-16.
class PathTraitsDos : public PathGrammarT<PathRulesDos, char>
{
public:
    static constexpr char DefaultSeparator = '\\';
    static constexpr char const* DefaultSeparatorString = "\\";
    static constexpr char const* Separators = "\\/";
    static constexpr char const* DriveSeparator = ":";
    static constexpr char const* PathEscape = "\\\\?\\";
    static constexpr char const* LongUNC = "\\\\?\\UNC\\";
    static constexpr char const* ShortUNC = "\\\\";

    class Wide : public PathGrammarT<PathRulesDos, char16_t>
    {
    public:
        static constexpr char16_t DefaultSeparator = u'\\';
        static constexpr char16_t const* DefaultSeparatorString = u"\\";
        static constexpr char16_t const* Separators = u"\\/";
        static constexpr char16_t const* DriveSeparator = u":";
        static constexpr char16_t const* PathEscape = u"\\\\?\\";
        static constexpr char16_t const* LongUNC = u"\\\\?\\UNC\\";
        static constexpr char16_t const* ShortUNC = u"\\\\";
    };
};

/// Paths with one separator and one tree. The inherited operations take UTF-8; Wide has them for UTF-16.
class PathTraitsUnix : public PathGrammarT<PathRulesUnix, char>
{
public:
    static constexpr char DefaultSeparator = '/';
    static constexpr char const* DefaultSeparatorString = "/";
    static constexpr char const* Separators = "/";
    static constexpr char const* DriveSeparator = "";
    static constexpr char const* PathEscape = "";
    static constexpr char const* LongUNC = "";
    static constexpr char const* ShortUNC = "";

    class Wide : public PathGrammarT<PathRulesUnix, char16_t>
    {
    public:
        static constexpr char16_t DefaultSeparator = u'/';
        static constexpr char16_t const* DefaultSeparatorString = u"/";
        static constexpr char16_t const* Separators = u"/";
        static constexpr char16_t const* DriveSeparator = u"";
        static constexpr char16_t const* PathEscape = u"";
        static constexpr char16_t const* LongUNC = u"";
        static constexpr char16_t const* ShortUNC = u"";
    };
};

/// The grammar of this system: what real file operations go by.
using PathTraitsNative = PathTraitsUnix;

} // namespace Kernel
