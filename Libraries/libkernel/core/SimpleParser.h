#pragma once

#include "libkernel/core/String.h"

#include <vector>

namespace Kernel {

/// Parses lists of numbers with units, such as "2 cm, 3.5 mm", against a set of keywords.
///
/// Items stand between separators. An item is a number, perhaps with a keyword behind it, or nothing. A number is
/// decimal digits with at most one point, without sign or exponent. A keyword begins with an ASCII letter or a code
/// point beyond ASCII and runs on over those, digits and "_"; case counts. Spaces and tabs between tokens are skipped;
/// a separator is looked for first where a token may begin. One parser is for one thread at a time.
class KERNEL_API SimpleParser
{
public:
    enum class ErrorCode
    {
        None = 0,
        Empty = 1,          ///< No text, or nothing at all before its end; the length is that of the text.
        BadNumber = 2,      ///< A second point, or only a point: from the number's start up to the bad character.
        Unexpected = 3,     ///< A character that begins no token, or a token out of its place: one byte.
        UnknownKeyword = 4, ///< The whole keyword.
        BadEncoding = 5     ///< The byte in a keyword that begins no well-formed sequence (RFC 3629): one byte.
    };

    struct ResultPair
    {
        double value = 0.0;
        int keyword = -1; ///< Its number, from 0 in the order given; -1 if there is none.
        bool isEmpty = true;
    };

    /// Without keywords, items are plain numbers.
    explicit SimpleParser(char separator);
    SimpleParser(std::vector<String8> const& keywords, char separator);

    /// Numbers are rounded to so many decimals, half up, by the digits as they were written; below 0, the default,
    /// they stay as they are.
    void SetMaxDecimalPlaces(int places);

    /// True on success. Otherwise the error is set, and there are no results. The flag has no meaning. Any bytes may be
    /// given. A number beyond the range of double is infinity.
    bool Parse(String8 const& text, bool flag);

    /// The items of the last parse. Behind a last separator stands an empty item.
    std::vector<ResultPair> const& GetResults() const { return m_results; }
    /// What stopped the last parse.
    ErrorCode GetErrorCode() const { return m_errorCode; }
    /// Where the error lies in the text, in bytes; both 0 without one.
    int GetErrorPos() const { return m_errorPos; }
    int GetErrorLength() const { return m_errorLength; }

private:
    bool Fail(ErrorCode code, int pos, int length);
    bool ParseItems(String8 const& text);
    bool ReadNumber(String8 const& text, int& pos, double& value);
    bool ReadKeyword(String8 const& text, int& pos, int& keyword);

    std::vector<String8> m_keywords;
    char m_separator;
    int m_maxDecimalPlaces = -1;
    std::vector<ResultPair> m_results;
    ErrorCode m_errorCode = ErrorCode::None;
    int m_errorPos = 0;
    int m_errorLength = 0;
};

} // namespace Kernel
