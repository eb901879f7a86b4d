#include "libkernel/platform/PlatformFile.h"

#include <climits>
#include <cstdlib>
#include <pwd.h>
#include <unistd.h>

namespace Kernel::Platform {

std::string GetCurrentFolder()
{
    char text[PATH_MAX];
    return ::getcwd(text, sizeof text) ? text : "";
}

std::string GetHomeFolder()
{
    if (char const* const home = std::getenv("HOME"); home && *home) return home;
    passwd record = {};
    passwd* found = nullptr;
    char text[4096];
    if (::getpwuid_r(::getuid(), &record, text, sizeof text, &found) != 0 || !found || !found->pw_dir) return {};
    return found->pw_dir;
}

std::string GetExecutablePath()
{
    std::string path;
    return GetSystemFileCalls().readLink("/proc/self/exe", path) == 0 ? path : std::string();
}

std::string GetTemporaryFolder()
{
    char const* const folder = std::getenv("TMPDIR");
    return folder && *folder ? folder : "/tmp";
}

std::string GetFolderOf(char const* path)
{
    std::string text = path ? path : "";
    auto const dropTail = [&](auto drops) {
        while (!text.empty() && drops(text.back())) text.pop_back();
    };
    bool const rooted = !text.empty() && text[0] == '/';
    dropTail([](char c) { return c == '/'; });
    dropTail([](char c) { return c != '/'; });
    dropTail([](char c) { return c == '/'; });
    if (!text.empty()) return text;
    return rooted ? "/" : ".";
}

} // namespace Kernel::Platform
