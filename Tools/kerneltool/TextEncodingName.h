#pragma once

#include "libkernel/core/StringEncoding.h"
#include "libkernel/core/UnicodeFile.h"

#include <string>

namespace KernelTool {

/// What --from and --to name: "UTF-8" and its relatives, "page:NUMBER", "mac:SCRIPT" or "mac:SCRIPT,LANGUAGE",
/// "pdfdoc", or a charset that ICU knows.
struct TextEncodingName
{
    enum class Kind
    {
        Unicode,
        MappingFile,
        Charset
    };

    Kind kind = Kind::Charset;
    std::string name;
    Kernel::UnicodeEncoding unicode{};                   ///< With Unicode: the form without a mark.
    Kernel::Counted<Kernel::StringEncoding> mappingFile; ///< With MappingFile.

    /// Throws Failure for a mapping file that is not known or not installed. Charsets are not looked at.
    static TextEncodingName Parse(std::string const& name);
};

/// The text of @p bytes; @p undefined is the number of codes that stand for nothing and came out as a stand-in. Throws
/// Failure where the bytes are ill-formed Unicode or the charset is unknown.
Kernel::String8 Decode(TextEncodingName const& encoding, std::string const& bytes, size_t& undefined);

/// The bytes of @p text; @p unmapped is the number of characters that have none and came out as a stand-in. Throws
/// Failure where the charset is unknown.
std::string Encode(TextEncodingName const& encoding, Kernel::String8 const& text, size_t& unmapped);

} // namespace KernelTool
