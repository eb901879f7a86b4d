#pragma once

#include "libkernel/core/Types.h"
#include "support/TempFolder.h"

#include <fcntl.h>
#include <nlohmann/json.hpp>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

// Runs the built program as a person would. KERNELTOOL is its path.

namespace KernelTest {

using Kernel::i64;
using Kernel::u32;
using Kernel::u64;

struct ToolResult
{
    int status = -1; ///< Exit status; 128 + n for a signal n.
    std::string out;
    std::string err;
};

/// The program at work, with its streams in files of @p folder.
class ToolProcess
{
public:
    ToolProcess(std::vector<std::string> const& words, std::string const& folder, std::string const& outPath = {})
        : m_out(outPath.empty() ? folder + "/.out" : outPath), m_err(folder + "/.err")
    {
        std::string const in = folder + "/.in";
        m_pid = ::fork();
        if (m_pid != 0) return;
        constexpr int flags = O_WRONLY | O_CREAT | O_TRUNC;
        ::dup2(::open(in.c_str(), O_RDONLY | O_CREAT, 0600), 0);
        ::dup2(::open(m_out.c_str(), flags, 0600), 1);
        ::dup2(::open(m_err.c_str(), flags, 0600), 2);
        std::vector<char*> arguments = {const_cast<char*>(KERNELTOOL)};
        for (std::string const& word : words) arguments.push_back(const_cast<char*>(word.c_str()));
        arguments.push_back(nullptr);
        if (::chdir(folder.c_str()) == 0) ::execv(KERNELTOOL, arguments.data());
        ::_exit(99);
    }
    ToolProcess(ToolProcess const&) = delete;
    ToolProcess& operator=(ToolProcess const&) = delete;
    ~ToolProcess()
    {
        if (m_pid > 0) Wait();
    }

    void Kill(int signal) { ::kill(m_pid, signal); }
    int Wait()
    {
        int status = 0;
        ::waitpid(m_pid, &status, 0);
        m_pid = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    }
    std::string ReadOut() const { return TestSupport::ReadWholeFile(m_out); }
    std::string ReadErr() const { return TestSupport::ReadWholeFile(m_err); }

private:
    std::string const m_out;
    std::string const m_err;
    pid_t m_pid = -1;
};

/// Runs to the end in @p folder, with @p input as standard input.
inline ToolResult RunKernelTool(std::vector<std::string> const& words, std::string const& folder,
                                std::string const& input = {}, std::string const& outPath = {})
{
    TestSupport::WriteWholeFile(folder + "/.in", input);
    ToolProcess process(words, folder, outPath);
    ToolResult result;
    result.status = process.Wait();
    if (outPath.empty()) result.out = process.ReadOut();
    result.err = process.ReadErr();
    return result;
}

} // namespace KernelTest
