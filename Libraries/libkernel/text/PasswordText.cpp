#include "libkernel/text/PasswordText.h"

#include "libkernel/core/ConvertEnc.h"

#include <memory>
#include <unicode/usprep.h>
#include <unicode/ustring.h>

namespace Kernel {
namespace {

struct ProfileCloser
{
    void operator()(UStringPrepProfile* profile) const { usprep_close(profile); }
};

// Strict, unlike ConvertEnc: two ways to write one character must not both pass. False for what isn't well-formed.
bool ToWellFormed16(String16& wide, String8 const& text)
{
    UErrorCode error = U_ZERO_ERROR;
    i32 length = 0;
    char16_t* const units = wide.SetLength(text.GetLength()); // No byte becomes more than one unit.
    u_strFromUTF8(units, text.GetLength(), &length, text.GetData(), text.GetLength(), &error);
    if (U_FAILURE(error)) return false;
    wide.SetLength(length);
    return true;
}

} // namespace

bool PreparePassword(String8& out, String8 const& password)
{
    UErrorCode error = U_ZERO_ERROR;
    std::unique_ptr<UStringPrepProfile, ProfileCloser> const profile(
        usprep_openByType(USPREP_RFC4013_SASLPREP, &error));
    String16 wide;
    if (U_FAILURE(error) || !ToWellFormed16(wide, password)) return false;

    String16 prepared;
    i32 length = wide.GetLength();
    for (bool again = true; again;) {
        error = U_ZERO_ERROR;
        i32 const room = length;
        length = usprep_prepare(profile.get(), wide.GetData(), wide.GetLength(), prepared.SetLength(room), room,
                                USPREP_DEFAULT, nullptr, &error);
        again = error == U_BUFFER_OVERFLOW_ERROR && length > room;
    }
    if (U_FAILURE(error)) return false;
    prepared.SetLength(length);
    out = ConvertedTo<TEncUtf8>(prepared);
    return true;
}

} // namespace Kernel
