#pragma once

#include "libkernel/core/String.h"

namespace KernelTool {

/// Takes a path for a new file: nobody else can have it from here on. Gives it back unless the file was made.
class Reservation
{
public:
    /// Throws Failure if something stands there already or the file cannot be made.
    explicit Reservation(Kernel::String8 const& path);
    Reservation(Reservation const&) = delete;
    Reservation& operator=(Reservation const&) = delete;
    ~Reservation();
    void Use() { m_used = true; }

private:
    Kernel::String8 const m_path;
    bool m_used = false;
};

} // namespace KernelTool
