#include "libkernel/core/AssertTrap.h"

#include "libkernel/core/Assert.h"
#include "libkernel/platform/Debug.h"

#include <cstring>
#include <string>

namespace Kernel {

std::atomic<AssertTrap*> AssertTrap::s_pInstance{nullptr};

namespace {

bool IsSeparator(char c)
{
    return c == '/' || c == '\\';
}

/// The folder the sources were built from: this file's own path without its last four elements, ending in a separator.
std::string const& GetSourceRoot()
{
    static std::string const s_root = [] {
        std::string path = __FILE__;
        for (int element = 0; element < 4; ++element) {
            while (!path.empty() && !IsSeparator(path.back())) path.pop_back();
            if (!path.empty()) path.pop_back();
        }
        if (path.empty() || !IsSeparator(path.back())) path += path.find('\\') == std::string::npos ? '/' : '\\';
        return path;
    }();
    return s_root;
}

} // namespace

AssertTrap::AssertTrap()
{
    GetSourceRoot();
    AssertTrap* none = nullptr;
    if (!s_pInstance.compare_exchange_strong(none, this))
        Platform::FailAssertion("a second assert trap was made", __FILE__, __LINE__);
}

AssertTrap::~AssertTrap()
{
    s_pInstance.store(nullptr);
}

void AssertTrap::NotifyAssert(char const* file, char const* message, int line)
{
    AssertTrap* const trap = s_pInstance.load();
    if (!trap) return;
    std::string const& root = GetSourceRoot();
    if (std::strncmp(file, root.c_str(), root.size()) == 0) file += root.size();
    trap->HandleAssert(file, message, line);
}

void FailAssertion(char const* file, char const* condition, int line)
{
    AssertTrap::NotifyAssert(file, condition, line);
    Platform::FailAssertion(condition, file, line);
}

} // namespace Kernel
