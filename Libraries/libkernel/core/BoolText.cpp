#include "libkernel/core/BoolText.h"

#include <array>

namespace Kernel {
namespace {

constexpr u32 c_styleCount = 10;
constexpr char const* c_words[c_styleCount][2] = {
    {"false", "true"}, {"False", "True"}, {"FALSE", "TRUE"}, {"no", "yes"}, {"No", "Yes"},
    {"NO", "YES"},     {"off", "on"},     {"Off", "On"},     {"Off", "On"}, {"0", "1"},
};

template <class S>
S FromAscii(char const* text)
{
    std::basic_string_view<char> const view(text);
    typename S::Unit* to;
    S result(static_cast<int>(view.size()), to);
    for (char const c : view) *to++ = static_cast<typename S::Unit>(c);
    return result;
}

} // namespace

template <class S>
S ToStringT(bool value, BoolStyle style)
{
    static auto const s_words = [] {
        std::array<std::array<S, 2>, c_styleCount> words;
        for (u32 i = 0; i < c_styleCount; ++i)
            for (u32 word = 0; word < 2; ++word) words[i][word] = FromAscii<S>(c_words[i][word]);
        return words;
    }();
    auto const row = static_cast<u32>(style);
    return row < c_styleCount ? s_words[row][value] : S();
}

template KERNEL_API String8 ToStringT<String8>(bool, BoolStyle);
template KERNEL_API String16 ToStringT<String16>(bool, BoolStyle);
template KERNEL_API String32 ToStringT<String32>(bool, BoolStyle);

} // namespace Kernel
