#include "libkernel/archive/ArchiveCreateResult.h"

#include "libkernel/core/Format.h"
#include "libkernel/text/StringLocaliser.h"

namespace Kernel {

namespace {

struct Message
{
    ArchiveCreateResult::Code code;
    char const* text;
};

using Code = ArchiveCreateResult::Code;

constexpr Message c_messages[] = {
    {Code::BadPath, "%1 failed because the file path that given was not valid."},
    {Code::CouldNotCreate, "%1 failed because the file could not be created. Please report this to Tarsk."},
    {Code::ChangesNotAllowed, "%1 failed because changes to the file were not allowed."},
    {Code::InUse, "%1 failed because the file was already open by another application."},
    {Code::ExistsReadOnly, "%1 failed because the file already exists and is read only."},
    {Code::WriteFailed, "%1 failed because the file could not be written to."},
    {Code::AccessDenied, "%1 failed. Access was denied."},
    {Code::NotPermitted, "%1 failed because you do not have permission to create a file in that location."},
    {Code::ReadOnlyVolume, "%1 failed. Destination volume is read only."},
    {Code::NoMemory, "%1 failed because of an internal error."},
    {Code::IsDirectory, "%1 failed because the file path exists as a directory."},
    {Code::TooManyFiles, "%1 failed because there are too many files open in the system"},
    {Code::TooLarge, "%1 failed because the file is too large for the system."},
    {Code::NoSpace, "%1 failed because the device is out of space."},
    {Code::NotSupported, "%1 failed because the operation is not supported by the device."},
};

String8 Localised(char const* text)
{
    return StringLocaliser::GetInstance().Localise(text, "Save errors");
}

} // namespace

String8 ArchiveCreateResult::GetErrorMessage() const
{
    return GetErrorMessage(Localised("Save"));
}

String8 ArchiveCreateResult::GetErrorMessage(String8 const& operationName) const
{
    for (Message const& message : c_messages)
        if (message.code == m_code) return Format(Localised(message.text), operationName);
    return String8();
}

} // namespace Kernel
