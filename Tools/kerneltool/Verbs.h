#pragma once

#include "CommandLine.h"

namespace KernelTool {

/// Thrown by a verb for words that the table could not refuse.
struct UsageProblem
{
    std::string problem;
};

// The verbs. Each gives the exit status and throws Failure or a library exception.
int RunCreate(Arguments const& arguments);
int RunPut(Arguments const& arguments);
int RunRemove(Arguments const& arguments);
int RunList(Arguments const& arguments);
int RunCat(Arguments const& arguments);
int RunExtract(Arguments const& arguments);
int RunInfo(Arguments const& arguments);
int RunHistory(Arguments const& arguments);
int RunVerify(Arguments const& arguments);
int RunTest(Arguments const& arguments);
int RunScratch(Arguments const& arguments);
int RunRecover(Arguments const& arguments);
int RunStreamline(Arguments const& arguments);
int RunThumbnail(Arguments const& arguments);
int RunStreamDump(Arguments const& arguments);
int RunStreamCheck(Arguments const& arguments);
int RunTextSort(Arguments const& arguments);
int RunTextConvert(Arguments const& arguments);
int RunTextDetect(Arguments const& arguments);
int RunTextChars(Arguments const& arguments);

} // namespace KernelTool
