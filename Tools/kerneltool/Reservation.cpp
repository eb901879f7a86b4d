#include "Reservation.h"

#include "Diagnostics.h"
#include "Output.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/platform/PlatformFile.h"

#include <cerrno>

namespace KernelTool {

using namespace Kernel;

Reservation::Reservation(String8 const& path) : m_path(path)
{
    Platform::OpenFlags flags;
    flags.write = flags.create = flags.exclusive = true;
    Platform::FileHandle handle = Platform::c_noHandle;
    int const error = Platform::GetFileCalls().open(path.GetData(), flags, handle);
    std::string const what = "creating '" + ToStd(path) + "'";
    if (error == EEXIST) throw MakeFailure(what, File::OpenUnmanagedResult::Exists);
    if (error != 0) throw MakeFailure(what, File::TranslateError(error));
    Platform::GetFileCalls().close(handle);
}

Reservation::~Reservation()
{
    if (!m_used) FileSystem::Delete(m_path, 0);
}

} // namespace KernelTool
