#pragma once

namespace KernelTool {

/// From here on Ctrl-C sets the abort flag; a second one ends the program at once, which a document survives too.
void CatchInterrupts();
/// The flag, for whatever takes one. Lives as long as the process.
bool const* GetAbortFlag();
bool IsInterrupted();
/// Throws AbortException once the flag is set.
void StopIfInterrupted();

} // namespace KernelTool
