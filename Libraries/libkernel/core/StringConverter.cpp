#include "libkernel/core/StringConverter.h"

#include "libkernel/core/CharTraits.h"
#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/MemoryHeadroom.h"
#include "libkernel/core/TextTools.h"
#include "libkernel/core/internal/FileBytes.h"

#include <cstring>
#include <limits>
#include <new>
#include <unicode/ucnv.h>
#include <unicode/ucsdet.h>

namespace Kernel {
namespace {

constexpr int c_longestText = std::numeric_limits<i32>::max() - 1;

struct ConverterCloser
{
    void operator()(UConverter* converter) const { ucnv_close(converter); }
};
using ConverterPtr = std::unique_ptr<UConverter, ConverterCloser>;

bool IsUtf8Name(char const* charset)
{
    return charset && std::strcmp(charset, "UTF-8") == 0;
}

ConverterPtr OpenConverter(char const* charset)
{
    UErrorCode status = U_ZERO_ERROR;
    ConverterPtr converter(ucnv_open(charset, &status));
    if (U_FAILURE(status)) converter.reset();
    return converter;
}

// Bytes up to the terminator; -1 for more than a string can hold.
int MeasureBytes(char const* text)
{
    size_t const length = text ? std::strlen(text) : 0;
    return length > static_cast<size_t>(c_longestText) ? -1 : static_cast<int>(length);
}

String8 TakeUtf8(char const* text, int n)
{
    return n > 0 ? String8(text, CharTraits<TEncUtf8>::GetValidLength(text, n, true)) : String8();
}

// Some converters, those of SCSU and UTF-7 among them, let surrogates without a partner through.
void MendSurrogates(String16& text)
{
    int const n = text.GetLength();
    int i = CharTraits<TEncUtf16>::GetValidLength(text.GetData(), n, true);
    if (i == n) return;
    char16_t* const units = text.GetWritable();
    while (i < n) {
        units[i++] = 0xFFFD;
        i += CharTraits<TEncUtf16>::GetValidLength(units + i, n - i, true);
    }
}

String16 FromConverter(UConverter* converter, char const* text, int n)
{
    if (n <= 0) return {};
    UErrorCode status = U_ZERO_ERROR;
    ucnv_reset(converter);
    int const length = ucnv_toUChars(converter, nullptr, 0, text, n, &status);
    if ((U_FAILURE(status) && status != U_BUFFER_OVERFLOW_ERROR) || length <= 0) return {};
    String16 result;
    status = U_ZERO_ERROR;
    ucnv_toUChars(converter, result.SetLength(length), length, text, n, &status);
    if (U_FAILURE(status)) return {};
    MendSurrogates(result);
    return result;
}

template <class T, class F>
T EmptyWithoutMemory(F work)
{
    try {
        return work();
    } catch (std::bad_alloc const&) {
        return T();
    }
}

String8 ToUtf8(String16 const& text)
{
    return ConvertedTo<TEncUtf8>(text);
}

String8 Detect(char const* bytes, u64 size)
{
    if (size == 0 || size > static_cast<u64>(c_longestText)) return {};
    RequireMemory(c_icuHeadroom);
    UErrorCode status = U_ZERO_ERROR;
    std::unique_ptr<UCharsetDetector, decltype([](UCharsetDetector* d) { ucsdet_close(d); })> const detector(
        ucsdet_open(&status));
    if (U_FAILURE(status) || !detector) return {}; // Without memory it is null, and there is no error.
    ucsdet_setText(detector.get(), bytes, static_cast<int>(size), &status);
    UCharsetMatch const* const match = ucsdet_detect(detector.get(), &status);
    if (U_FAILURE(status) || !match) return {};
    char const* const name = ucsdet_getName(match, &status);
    return U_FAILURE(status) ? String8() : String8(name);
}

} // namespace

StringConverter::StringConverter(String8 const& name)
{
    if (!IsUtf8Name(name.GetData())) m_converter = OpenConverter(name.GetData()).release();
}

StringConverter::~StringConverter()
{
    ucnv_close(static_cast<UConverter*>(m_converter));
}

String8 StringConverter::Convert(char const* text)
{
    return EmptyWithoutMemory<String8>([&] {
        int const n = MeasureBytes(text);
        return m_converter ? ToUtf8(FromConverter(static_cast<UConverter*>(m_converter), text, n)) : TakeUtf8(text, n);
    });
}

String8 EncodedToUtf8(char const* text, char const* charset)
{
    return EmptyWithoutMemory<String8>([&] {
        if (IsUtf8Name(charset)) return TakeUtf8(text, MeasureBytes(text));
        ConverterPtr const converter = OpenConverter(charset);
        return converter ? ToUtf8(FromConverter(converter.get(), text, MeasureBytes(text))) : String8();
    });
}

String16 EncodedToUtf16(char const* text, char const* charset)
{
    return EmptyWithoutMemory<String16>([&] {
        if (IsUtf8Name(charset)) return ConvertedTo<TEncUtf16>(TakeUtf8(text, MeasureBytes(text)));
        ConverterPtr const converter = OpenConverter(charset);
        return converter ? FromConverter(converter.get(), text, MeasureBytes(text)) : String16();
    });
}

std::unique_ptr<char[]> Utf8ToEncoded(String8 const& text, char const* charset)
{
    return EmptyWithoutMemory<std::unique_ptr<char[]>>([&]() -> std::unique_ptr<char[]> {
        String8 const valid = TakeUtf8(text.GetData(), text.GetLength());
        auto const makeBlock = [](int size) { return std::make_unique<char[]>(static_cast<size_t>(size) + 4); };
        if (IsUtf8Name(charset)) {
            auto block = makeBlock(valid.GetLength());
            std::memcpy(block.get(), valid.GetData(), static_cast<size_t>(valid.GetLength()));
            return block;
        }
        ConverterPtr const converter = OpenConverter(charset);
        if (!converter) return nullptr;
        String16 const wide = ConvertedTo<TEncUtf16>(valid);
        UErrorCode status = U_ZERO_ERROR;
        int const size = ucnv_fromUChars(converter.get(), nullptr, 0, wide.GetData(), wide.GetLength(), &status);
        if (U_FAILURE(status) && status != U_BUFFER_OVERFLOW_ERROR) return nullptr;
        auto block = makeBlock(size);
        status = U_ZERO_ERROR;
        ucnv_fromUChars(converter.get(), block.get(), size, wide.GetData(), wide.GetLength(), &status);
        if (U_FAILURE(status)) return nullptr;
        return block;
    });
}

bool Utf16ToEncoded(std::vector<char>& bytes, std::vector<int>& sources, String16 const& text, char const* charset)
{
    bytes.clear();
    sources.clear();
    ConverterPtr const converter = OpenConverter(charset);
    if (!converter) return false;
    u64 const most = static_cast<u64>(ucnv_getMaxCharSize(converter.get())) * (static_cast<u64>(text.GetLength()) + 10);
    bool isDone = EmptyWithoutMemory<bool>([&] {
        bytes.resize(most);
        sources.resize(most);
        return true;
    });
    if (isDone) {
        UErrorCode status = U_ZERO_ERROR;
        char* to = bytes.data();
        char16_t const* from = text.GetData();
        ucnv_fromUnicode(converter.get(), &to, to + most, &from, from + text.GetLength(), sources.data(), true,
                         &status);
        isDone = !U_FAILURE(status);
        if (isDone) bytes.resize(static_cast<size_t>(to - bytes.data()));
    }
    if (!isDone) bytes.clear();
    sources.resize(bytes.size());
    return isDone;
}

String8 IcuCharsetDetect(String8 const& path)
{
    return EmptyWithoutMemory<String8>([&] {
        u64 size = 0;
        auto const bytes = ReadFileBytes(path.GetData(), static_cast<u64>(c_longestText), size);
        return bytes ? Detect(bytes.get(), size) : String8();
    });
}

String8 IcuCharsetDetect(std::unique_ptr<char[]> bytes, i64 size)
{
    return EmptyWithoutMemory<String8>(
        [&] { return bytes && size > 0 ? Detect(bytes.get(), static_cast<u64>(size)) : String8(); });
}

String8 IcuLoadTextFile(String8 const& path, String8 const& charset)
{
    return EmptyWithoutMemory<String8>([&]() -> String8 {
        u64 size = 0;
        auto const bytes = ReadFileBytes(path.GetData(), static_cast<u64>(c_longestText), size);
        if (!bytes) return {};
        UErrorCode status = U_ZERO_ERROR;
        ConverterPtr const converter(ucnv_open(charset.GetData(), &status));
        if (status != U_ZERO_ERROR && status != U_AMBIGUOUS_ALIAS_WARNING) return {};
        u64 const room = static_cast<u64>(ucnv_getMinCharSize(converter.get())) * size;
        if (room == 0 || room > static_cast<u64>(c_longestText)) return {};
        String16 text;
        status = U_ZERO_ERROR;
        int const length = ucnv_toUChars(converter.get(), text.SetLength(static_cast<int>(room)),
                                         static_cast<int>(room), bytes.get(), static_cast<int>(size), &status);
        if (U_FAILURE(status)) return {};
        text.SetLength(length);
        MendSurrogates(text);
        return CanonicaliseLineEnds(ToUtf8(text));
    });
}

} // namespace Kernel
