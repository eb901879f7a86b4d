#include "libkernel/platform/Debug.h"

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <string>
#include <unistd.h>

namespace Kernel::Platform {
namespace {

std::atomic<void (*)(char const*)> s_sink{nullptr};

void WriteAll(int fd, char const* text)
{
    size_t left = std::strlen(text);
    while (left > 0) {
        ssize_t const n = ::write(fd, text, left);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return;
        text += n;
        left -= static_cast<size_t>(n);
    }
}

} // namespace

bool IsDebuggerAttached()
{
    int const fd = ::open("/proc/self/status", O_RDONLY | O_CLOEXEC);
    if (fd < 0) return false;
    char text[4096];
    ssize_t const n = ::read(fd, text, sizeof text - 1);
    ::close(fd);
    if (n <= 0) return false;
    text[n] = 0;
    static constexpr char c_field[] = "\nTracerPid:";
    char const* const field = std::strstr(text, c_field);
    return field && std::atoi(field + sizeof c_field - 1) != 0;
}

void WriteDebugOutput(char const* text)
{
    if (!text) return;
    if (auto const sink = s_sink.load()) {
        sink(text);
        return;
    }
    WriteAll(STDERR_FILENO, text);
}

void ShowMessage(char const* title, char const* text)
{
    std::string message(title ? title : "");
    message.append("\n").append(text ? text : "");
    if (message.back() != '\n') message += '\n';
    WriteDebugOutput(message.c_str());
}

void SetDebugSink(void (*sink)(char const* text))
{
    s_sink.store(sink);
}

void FailAssertion(char const* what, char const* file, int line)
{
    char text[512];
    std::snprintf(text, sizeof text, "%s:%d: %s\n", file, line, what);
    WriteAll(STDERR_FILENO, text);
    std::abort();
}

} // namespace Kernel::Platform
