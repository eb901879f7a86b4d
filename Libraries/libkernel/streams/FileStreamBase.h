#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/FileIOException.h"
#include "libkernel/streams/FileStreamErrorHandler.h"

#include <atomic>

namespace Kernel {

/// What the file streams share: the open file, the first failure, and whom to tell of it.
///
/// A stream is open, broken or closed. The first failure breaks it, for good, and goes to the error handler if one is
/// set, otherwise it is thrown as FileIOException. From then on reads and writes give 0, seeks and truncations false
/// and flushes true, at once and without touching the file; there is nothing more to report. Nothing is tried again:
/// who wants that looks at GetReason and opens a new stream. Reaching the end of a file is no failure.
class KERNEL_API FileStreamBase
{
public:
    FileStreamBase(FileStreamBase const&) = delete;
    FileStreamBase& operator=(FileStreamBase const&) = delete;

    bool IsClosed() const { return m_handle == Platform::c_noHandle; }
    bool IsBroken() const { return m_broken.load(std::memory_order_acquire); }
    /// Why the stream is broken; NoError while it isn't.
    FileIOException::Reason GetReason() const { return m_reason.load(std::memory_order_acquire); }
    /// Null means that failures are thrown. Not while another thread uses the stream.
    void SetErrorHandler(Counted<FileStreamErrorHandler> const& handler) { m_handler = handler; }

protected:
    /// Takes over an open file.
    explicit FileStreamBase(Platform::FileHandle handle) : m_handle(handle) {}
    /// Closes the file and reports nothing.
    ~FileStreamBase();

    Platform::FileHandle GetHandle() const { return m_handle; }
    bool IsUsable() const { return !IsClosed() && !IsBroken(); }

    /// Breaks the stream for @p error, an `errno`. Only the first call does anything, whichever thread makes it. An
    /// error of 0 is reported only with @p force.
    void OnErrorI(int error, bool force = false) const;
    /// Closes the file without a report; gives its error.
    int CloseHandle();
    /// Closes the file; false after reporting a failure.
    bool CloseI();
    /// Size of the file. 0, with @p ok false, after reporting a failure, and for a stream that is broken or closed.
    u64 QuerySize(bool& ok) const;

private:
    Platform::FileHandle m_handle;
    Counted<FileStreamErrorHandler> m_handler;
    // Atomic, because positional reads of one stream may fail on several threads at once; queries break it too.
    mutable std::atomic<bool> m_broken{false};
    mutable std::atomic<FileIOException::Reason> m_reason{FileIOException::Reason::NoError};
};

} // namespace Kernel
