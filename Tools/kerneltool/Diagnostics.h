#pragma once

#include "CommandLine.h"
#include "libkernel/archive/Archive.h"
#include "libkernel/streams/File.h"
#include "libkernel/streams/FileIOException.h"

#include <string>

namespace KernelTool {

/// What went wrong, as the person is told: "kerneltool: WHAT failed: NAME (NUMBER)", and a line of advice.
struct Failure
{
    std::string what;
    std::string name;
    int number = 0;
    std::string advice;
    int status = ExitFailed;
};

/// The library's results by their names, with advice where there is something to do.
Failure MakeFailure(std::string const& what, Kernel::Archive::OpenResult result);
Failure MakeFailure(std::string const& what, Kernel::Archive::CreateResult const& result);
Failure MakeFailure(std::string const& what, Kernel::Archive::CreateSessionResult result);
Failure MakeFailure(std::string const& what, Kernel::Archive::StreamlineResult result);
Failure MakeFailure(std::string const& what, Kernel::Archive::VerifyResult result);
Failure MakeFailure(std::string const& what, Kernel::Archive::BlockCheck result);
Failure MakeFailure(std::string const& what, Kernel::File::OpenUnmanagedResult result);
Failure MakeFailure(std::string const& what, Kernel::FileIOException::Reason reason);

char const* GetName(Kernel::Archive::OpenResult result);

/// To be called in a handler: turns whatever is being handled into a failure of @p what. Only for exceptions of the
/// library, of the standard library, and Failure itself.
Failure DescribeCurrentException(std::string const& what);

void PrintFailure(Failure const& failure);

} // namespace KernelTool
