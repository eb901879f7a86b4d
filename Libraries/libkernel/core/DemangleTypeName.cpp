#include "libkernel/core/DemangleTypeName.h"

#include <cstdlib>
#include <cxxabi.h>
#include <memory>

namespace Kernel {
namespace {

struct Freer
{
    void operator()(char* text) const { std::free(text); }
};

// Behind the last "::" that doesn't lie inside template arguments or parentheses.
std::string_view WithoutNamespaces(std::string_view name)
{
    int depth = 0;
    for (size_t i = name.size(); i-- > 1;) {
        char const c = name[i];
        if (c == '>' || c == ')') ++depth;
        if (c == '<' || c == '(') --depth;
        if (depth == 0 && c == ':' && name[i - 1] == ':') return name.substr(i + 1);
    }
    return name;
}

} // namespace

String8 DemangleTypeName(char const* name, bool keepNamespaces)
{
    if (!name) return {};
    int status = 0;
    std::unique_ptr<char, Freer> const demangled(abi::__cxa_demangle(name, nullptr, nullptr, &status));
    if (!demangled) return name;
    return String8(keepNamespaces ? std::string_view(demangled.get()) : WithoutNamespaces(demangled.get()));
}

} // namespace Kernel
