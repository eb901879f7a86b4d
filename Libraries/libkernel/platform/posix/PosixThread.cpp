#include "libkernel/platform/Thread.h"

#include <algorithm>
#include <cstdio>
#include <fcntl.h>
#include <memory>
#include <new>
#include <pthread.h>
#include <pwd.h>
#include <sched.h>
#include <set>
#include <signal.h>
#include <string>
#include <string_view>
#include <sys/sysinfo.h>
#include <unistd.h>

namespace Kernel::Platform {
namespace {

thread_local u64 t_id = 0;

struct Start
{
    void (*run)(void*);
    void* context;
};

void* RunThread(void* argument)
{
    Start const start = *static_cast<Start*>(argument);
    delete static_cast<Start*>(argument);
    start.run(start.context);
    return nullptr;
}

bool CopyText(char const* from, char* to, u64 size)
{
    if (!from || !*from) return false;
    std::snprintf(to, size, "%s", from);
    return true;
}

size_t ReadSmallFile(char const* path, char* text, size_t size)
{
    int const fd = ::open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) return 0;
    ssize_t const n = ::read(fd, text, size - 1);
    ::close(fd);
    size_t const length = n > 0 ? static_cast<size_t>(n) : 0;
    text[length] = 0;
    return length;
}

} // namespace

u64 GetCurrentThreadId()
{
    if (t_id == 0) {
        // A child process has its parent's memory, but its one thread has an id of its own.
        static int const watched = ::pthread_atfork(nullptr, nullptr, [] { t_id = 0; });
        (void)watched;
        t_id = static_cast<u64>(::gettid());
    }
    return t_id;
}

void YieldThread()
{
    ::sched_yield();
}

void RunInChildProcesses(void (*run)())
{
    ::pthread_atfork(nullptr, nullptr, run);
}

bool StartDetachedThread(void (*run)(void*), void* context)
{
    std::unique_ptr<Start> start(new (std::nothrow) Start{run, context});
    pthread_attr_t attributes;
    if (!start || ::pthread_attr_init(&attributes) != 0) return false;
    ::pthread_attr_setdetachstate(&attributes, PTHREAD_CREATE_DETACHED);
    // The host's signals are for the host's threads.
    sigset_t all;
    sigset_t old;
    ::sigfillset(&all);
    ::pthread_sigmask(SIG_SETMASK, &all, &old);
    pthread_t thread;
    bool const started = ::pthread_create(&thread, &attributes, RunThread, start.get()) == 0;
    ::pthread_sigmask(SIG_SETMASK, &old, nullptr);
    ::pthread_attr_destroy(&attributes);
    if (started) (void)start.release();
    return started;
}

static_assert(sizeof(pthread_key_t) == sizeof(unsigned));

ThreadEnd::ThreadEnd(void (*run)(void*)) : m_hasKey(::pthread_key_create(&m_key, run) == 0) {}

bool ThreadEnd::Arm(void* context)
{
    return m_hasKey && ::pthread_setspecific(m_key, context) == 0;
}

bool IsThreadRunnable(u64 id)
{
    char path[64];
    std::snprintf(path, sizeof path, "/proc/self/task/%llu/stat", static_cast<unsigned long long>(id));
    char text[512];
    std::string_view const stat(text, ReadSmallFile(path, text, sizeof text));
    size_t const behindName = stat.rfind(')'); // The name may hold anything, parentheses too.
    return behindName != stat.npos && behindName + 2 < stat.size() && stat[behindName + 2] == 'R';
}

int CountUsableCpus()
{
    cpu_set_t set;
    CPU_ZERO(&set);
    if (::sched_getaffinity(0, sizeof set, &set) == 0) return std::max(1, CPU_COUNT(&set));
    return CountCpus().logical;
}

CpuCounts CountCpus()
{
    CpuCounts counts;
    counts.logical = std::max(1, static_cast<int>(::sysconf(_SC_NPROCESSORS_ONLN)));
    long const configured = ::sysconf(_SC_NPROCESSORS_CONF);
    std::set<std::string> cores; // Processors of one core name the same set of siblings.
    for (long i = 0; i < configured; ++i) {
        char path[96];
        std::snprintf(path, sizeof path, "/sys/devices/system/cpu/cpu%ld/topology/thread_siblings_list", i);
        char text[256];
        size_t const n = ReadSmallFile(path, text, sizeof text);
        if (n > 0) cores.emplace(text, n);
    }
    counts.cores = cores.empty() ? counts.logical : std::min(static_cast<int>(cores.size()), counts.logical);
    return counts;
}

bool GetHostName(char* name, u64 size)
{
    char text[256] = "";
    name[0] = 0;
    return ::gethostname(text, sizeof text - 1) == 0 && CopyText(text, name, size);
}

bool GetUserName(char* name, u64 size)
{
    name[0] = 0;
    passwd record = {};
    passwd* found = nullptr;
    char text[4096];
    if (::getpwuid_r(::geteuid(), &record, text, sizeof text, &found) != 0 || !found) return false;
    return CopyText(found->pw_name, name, size);
}

u64 GetMemorySize()
{
    struct ::sysinfo info = {};
    return ::sysinfo(&info) == 0 ? static_cast<u64>(info.totalram) * info.mem_unit : 0;
}

u64 GetCurrentProcessId()
{
    return static_cast<u64>(::getpid());
}

} // namespace Kernel::Platform
