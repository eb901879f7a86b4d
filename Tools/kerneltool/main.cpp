#include "CommandLine.h"
#include "Diagnostics.h"
#include "Interrupt.h"
#include "Output.h"
#include "libkernel/archive/Archive.h"

namespace {

std::string DescribeCall(std::vector<std::string> const& words)
{
    std::string what;
    for (size_t i = 0; i < words.size() && i < 2; ++i) what += (i ? " " : "") + words[i];
    return what.empty() ? "kerneltool" : what;
}

} // namespace

int main(int argc, char** argv)
{
    std::vector<std::string> const words(argv + 1, argv + argc);
    KernelTool::CatchInterrupts();
    int status = KernelTool::ExitFailed;
    try {
        status = KernelTool::CommandLine::Run(words);
        KernelTool::FinishOutput();
    } catch (...) {
        KernelTool::Failure const failure = KernelTool::DescribeCurrentException(DescribeCall(words));
        KernelTool::PrintFailure(failure);
        status = failure.status;
    }
    Kernel::Archive::PreShutdown();
    Kernel::Archive::PostShutdown();
    return status;
}
