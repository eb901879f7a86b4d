#include "libkernel/filesystem/PathTraits.h"

#include "libkernel/core/BaseCharTraits.h"
#include "libkernel/core/Exception.h"

#include <climits>
#include <string>

namespace Kernel {

namespace {

template <class Unit>
bool IsLetter(Unit u)
{
    return (u >= 'a' && u <= 'z') || (u >= 'A' && u <= 'Z');
}

template <class Unit>
Unit FoldCase(Unit u)
{
    return u >= 'A' && u <= 'Z' ? static_cast<Unit>(u + ('a' - 'A')) : u;
}

/// What a path begins with, and how much of it a canonical path keeps.
struct Root
{
    int length = 0;        // Units of the path that are the root.
    bool isShare = false;  // Dos: begins with two backslashes; a canonical path keeps two names behind them.
    bool isRooted = false; // ".." at the root disappears.
};

} // namespace

struct PathRulesDos
{
    static constexpr char c_separator = '\\';
    static constexpr bool c_hasDrives = true;

    template <class Unit>
    static bool IsSeparator(Unit u)
    {
        return u == '\\' || u == '/';
    }

    template <class Unit>
    static bool HasDrive(Unit const* p, int n)
    {
        return n >= 2 && IsLetter(p[0]) && p[1] == ':';
    }

    template <class Unit>
    static Root GetRoot(Unit const* p, int n)
    {
        if (n >= 2 && p[0] == '\\' && p[1] == '\\') {
            int i = 2;
            while (i < n && p[i] != '\\') ++i;
            return {i < n ? i + 1 : n, true, true};
        }
        if (HasDrive(p, n)) return {n > 2 && IsSeparator(p[2]) ? 3 : 2, false, true};
        if (n >= 1 && IsSeparator(p[0])) return {1, false, true};
        return {};
    }

    /// Bytes of UTF-8 above 127 are negative where char is signed; they are no control characters.
    template <class Unit>
    static bool IsValidPath(Unit const* p, int n)
    {
        for (int i = 0; i < n; ++i) {
            Unit const u = p[i];
            if (u >= 0 && u < 32) return false;
            if (u == '"' || u == '*' || u == '<' || u == '>' || u == '?' || u == '|') return false;
            if (u == ':' && !(i == 1 && IsLetter(p[0]))) return false;
            if (i == 0 || !IsSeparator(u) || !IsSeparator(p[i - 1])) continue;
            if (!(i == 1 && u == '\\' && p[0] == '\\')) return false;
        }
        return n > 0;
    }
};

struct PathRulesUnix
{
    static constexpr char c_separator = '/';
    static constexpr bool c_hasDrives = false;

    template <class Unit>
    static bool IsSeparator(Unit u)
    {
        return u == '/';
    }

    template <class Unit>
    static bool HasDrive(Unit const*, int)
    {
        return false;
    }

    template <class Unit>
    static Root GetRoot(Unit const* p, int n)
    {
        if (n >= 1 && p[0] == '/') return {1, false, true};
        if (n >= 2 && p[0] == '~' && p[1] == '/') return {2, false, true};
        return {};
    }

    template <class Unit>
    static bool IsValidPath(Unit const*, int n)
    {
        return n > 0;
    }
};

namespace {

template <class Rules, class Unit>
bool HasSeparator(Unit const* p, int n)
{
    for (int i = 0; i < n; ++i)
        if (Rules::IsSeparator(p[i])) return true;
    return false;
}

/// Writes a canonical path element by element. The output may lie over the input: the writer never overtakes the
/// reader, since a separator is written only before an element, where the input had one too, or at its root.
template <class Rules, class Unit>
class CanonicalWriter
{
public:
    explicit CanonicalWriter(Unit* out) : m_out(out) {}

    /// Writes the root of @p p and gives the index behind it.
    int WriteRoot(Unit const* p, int n)
    {
        Root const root = Rules::GetRoot(p, n);
        m_isRooted = root.isRooted;
        if (root.isShare) return WriteShare(p, n);
        for (int i = 0; i < root.length; ++i) m_out[i] = Rules::IsSeparator(p[i]) ? c_separator : p[i];
        m_length = root.length;
        m_isGlued = Rules::HasDrive(m_out, m_length) && m_length == 2;
        m_floor = m_length;
        return root.length;
    }

    /// Sees to it that a drive's root ends in a separator; the output has room for one unit more than the input.
    void CloseRoot()
    {
        if (!m_isGlued) return;
        m_out[m_length++] = c_separator;
        m_floor = m_length;
        m_isGlued = false;
    }

    void WriteElements(Unit const* p, int from, int n)
    {
        for (int i = from; i < n;) {
            int end = i;
            while (end < n && !Rules::IsSeparator(p[end])) ++end;
            int const length = end - i;
            if (length == 2 && p[i] == '.' && p[i + 1] == '.')
                WriteParent();
            else if (length > 0 && !(length == 1 && p[i] == '.'))
                WriteElement(p + i, length);
            i = end + 1;
        }
    }

    int Finish()
    {
        m_out[m_length] = 0;
        return m_length;
    }

    bool HasClimbedAboveRoot() const { return m_hasClimbed; }

private:
    static constexpr Unit c_separator = static_cast<Unit>(Rules::c_separator);

    int WriteShare(Unit const* p, int n)
    {
        m_out[0] = m_out[1] = c_separator;
        m_length = 2;
        int i = 2;
        for (int name = 0; name < 2; ++name) {
            int end = i;
            while (end < n && !Rules::IsSeparator(p[end])) ++end;
            if (name == 1 && end > i) m_out[m_length++] = c_separator;
            Move(p + i, end - i);
            i = end < n ? end + 1 : n;
        }
        m_floor = m_length;
        return i;
    }

    void WriteElement(Unit const* p, int length)
    {
        if (m_length > 0 && m_out[m_length - 1] != c_separator && !(m_isGlued && m_length == m_floor))
            m_out[m_length++] = c_separator;
        Move(p, length);
    }

    void WriteParent()
    {
        static constexpr Unit c_parent[2] = {'.', '.'};
        if (m_length == m_floor) {
            if (m_isRooted) {
                m_hasClimbed = true;
                return;
            }
            WriteElement(c_parent, 2);
            m_floor = m_length;
            return;
        }
        while (m_length > m_floor && m_out[m_length - 1] != c_separator) --m_length;
        if (m_length > m_floor) --m_length;
    }

    void Move(Unit const* p, int length)
    {
        std::char_traits<Unit>::move(m_out + m_length, p, static_cast<size_t>(length));
        m_length += length;
    }

    Unit* const m_out;
    int m_length = 0;
    int m_floor = 0;         // What ".." can't take: the root, and the ".." of a relative path.
    bool m_isRooted = false; // False: a ".." with nothing to take stays.
    bool m_isGlued = false;  // A drive without separator: "c:" and "a" make "c:a".
    bool m_hasClimbed = false;
};

template <class Rules, class Unit>
int CanonicalizeInto(Unit* out, Unit const* in, int length, bool& hasClimbed)
{
    hasClimbed = false;
    if (!HasSeparator<Rules>(in, length)) {
        std::char_traits<Unit>::move(out, in, static_cast<size_t>(length));
        out[length] = 0;
        return length;
    }
    CanonicalWriter<Rules, Unit> writer(out);
    int const begin = writer.WriteRoot(in, length);
    writer.WriteElements(in, begin, length);
    hasClimbed = writer.HasClimbedAboveRoot();
    return writer.Finish();
}

} // namespace

template <class Rules, class Unit>
bool PathGrammarT<Rules, Unit>::IsSeparator(int unit)
{
    return Rules::IsSeparator(unit);
}

template <class Rules, class Unit>
bool PathGrammarT<Rules, Unit>::IsRelative(Unit const* path)
{
    return !IsRoot(path);
}

template <class Rules, class Unit>
bool PathGrammarT<Rules, Unit>::IsRoot(Unit const* path)
{
    return path && Rules::GetRoot(path, BaseCharTraits<Unit>::GetLength(path)).length > 0;
}

template <class Rules, class Unit>
bool PathGrammarT<Rules, Unit>::IsSameRoot(Unit const* a, Unit const* b)
{
    if (!a || !b) return false;
    if (Rules::IsSeparator(a[0]) && Rules::IsSeparator(b[0])) return true;
    int const lengthA = BaseCharTraits<Unit>::GetLength(a);
    int const lengthB = BaseCharTraits<Unit>::GetLength(b);
    return Rules::HasDrive(a, lengthA) && Rules::HasDrive(b, lengthB) && FoldCase(a[0]) == FoldCase(b[0]);
}

template <class Rules, class Unit>
bool PathGrammarT<Rules, Unit>::IsValidPath(Unit const* path)
{
    return path && Rules::IsValidPath(path, BaseCharTraits<Unit>::GetLength(path));
}

template <class Rules, class Unit>
int PathGrammarT<Rules, Unit>::CommonPrefixLength(Unit const* a, Unit const* b)
{
    if (!a || !b) return 0;
    int length = 0;
    for (int i = 0; a[i] != 0 && b[i] != 0; ++i) {
        bool const isSeparator = Rules::IsSeparator(a[i]);
        if (isSeparator != Rules::IsSeparator(b[i]) || (!isSeparator && FoldCase(a[i]) != FoldCase(b[i]))) break;
        if (isSeparator || (Rules::c_hasDrives && i == 1 && a[i] == ':')) length = i + 1;
    }
    return length;
}

template <class Rules, class Unit>
int PathGrammarT<Rules, Unit>::Append(Unit* buffer, Unit const* tail, int capacity, int length, int tailLength)
{
    if (!buffer || !tail || tailLength < 1 || length < 0) throw InvalidArgException();
    int skip = 0;
    while (length > 0 && skip < tailLength && Rules::IsSeparator(tail[skip])) ++skip;
    Unit separator = 0;
    if (length > 0 && !Rules::IsSeparator(buffer[length - 1]))
        separator = skip > 0 ? tail[0] : static_cast<Unit>(Rules::c_separator);
    i64 const total = i64(length) + (separator != 0) + (tailLength - skip);
    if (total >= capacity) throw InvalidArgException();
    Unit* out = buffer + length + (separator != 0);
    std::char_traits<Unit>::move(out, tail + skip, static_cast<size_t>(tailLength - skip));
    if (separator != 0) buffer[length] = separator;
    buffer[total] = 0;
    return static_cast<int>(total);
}

template <class Rules, class Unit>
int PathGrammarT<Rules, Unit>::Combine(Unit* out, int capacity, Unit const* a, int aLength, Unit const* b, int bLength)
{
    if (!out || !a || !b || aLength < 0 || bLength < 0) throw InvalidArgException();
    // One unit for the separator behind a drive, one before b's elements and one for the terminator.
    std::basic_string<Unit> text(static_cast<size_t>(aLength) + static_cast<size_t>(bLength) + 3, Unit(0));
    i64 length = 0;
    if (Rules::GetRoot(b, bLength).length > 0) {
        bool hasClimbed;
        length = CanonicalizeInto<Rules>(text.data(), a, aLength, hasClimbed);
    } else {
        CanonicalWriter<Rules, Unit> writer(text.data());
        int const begin = writer.WriteRoot(a, aLength);
        writer.CloseRoot();
        writer.WriteElements(a, begin, aLength);
        writer.WriteElements(b, 0, bLength);
        length = writer.Finish();
    }
    if (length >= capacity) throw InvalidArgException();
    std::char_traits<Unit>::copy(out, text.data(), static_cast<size_t>(length) + 1);
    return static_cast<int>(length);
}

template <class Rules, class Unit>
int PathGrammarT<Rules, Unit>::Canonicalize(Unit* path, int length)
{
    bool hasClimbed;
    return CanonicalizeInto<Rules>(path, path, length, hasClimbed);
}

template <class Rules, class Unit>
bool PathGrammarT<Rules, Unit>::CanonicalizeSafe(Unit* out, Unit const* in, int& length)
{
    bool hasClimbed;
    length = CanonicalizeInto<Rules>(out, in, length, hasClimbed);
    return !hasClimbed;
}

template class PathGrammarT<PathRulesDos, char>;
template class PathGrammarT<PathRulesDos, char16_t>;
template class PathGrammarT<PathRulesUnix, char>;
template class PathGrammarT<PathRulesUnix, char16_t>;

} // namespace Kernel
