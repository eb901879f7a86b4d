#pragma once

#include "libkernel/core/Export.h"
#include "libkernel/core/String.h"
#include "libkernel/core/Types.h"

#include <nlohmann/json_fwd.hpp>

namespace Kernel {

class InStream;

/// What a look at a property stream found. No class is registered for it and none is made.
struct PropertyStreamReport
{
    enum class Result
    {
        Good = 0,
        NotAStream = 1, ///< The first four bytes belong to another format, or there are fewer than a header has.
        Newer = 2,      ///< The format version, or a property type, is later than this library's.
        Damaged = 3     ///< The bytes at offset are not what the format allows there.
    };

    Result result = Result::Good;
    /// Bytes from where the stream stood: of the first byte that is wrong or missing; on Good, just behind the list.
    u64 offset = 0;
    /// What is wrong there, in English; empty on Good.
    String8 reason;
    /// The tags that lead there, outermost first, as "Root/Name"; empty at the top.
    String8 path;

    bool IsGood() const { return result == Result::Good; }
};

/// Walks the property stream that stands at the position of @p in and says whether it is sound, and if not where and
/// why. Constant memory but for the set of objects and classes seen. A stream that this finds good can still be refused
/// by a program: what only a class can know, such as whether an object is plain or shared, is not looked at.
/// Exceptions of the stream pass through. Afterwards the stream stands as InSerialiserFile says.
KERNEL_API PropertyStreamReport CheckPropertyStream(InStream& in);

/// The same walk, giving what the stream holds; @p json is untouched unless the result is Good. The whole of it stands
/// in memory: some 40 bytes for a number, twice the size of raw bytes.
///
/// An object with fileTag, formatVersion, fileVersion, buildIndex (0 in format version 1) and properties, a list of
/// items in the order of the file:
///
///   every item            tag (not in data streams and lists), type (without the array bit), array: true for an array
///   types 1 to 10, 41     value: a number or boolean, or a list of them; a float that is no number gives null
///   43, 46                value: a string, or a list; bytes that are not UTF-8 become U+FFFD
///   47, 52                value: a code of four characters, or a list
///   42                    value: {code, version}; arrays {codes, version}
///   117                   value: {version, bits}, the bits as a hexadecimal number
///   11 to 40, 44, 45,     value: the bytes in lower-case hexadecimal, or a list of such
///   53 to 116, 118, 119
///   48                    value: {version, items}
///   49                    value: null; or ref: the index of an object already seen; or object: its index, classes and
///                         properties. classes is the chain from the object's class upwards: uid, version and defaults,
///                         or uid alone for a class already described, which ends the chain
///   50                    value: null; or class, version and properties
///   51                    value: null; or class and path
///   arrays of 49, 50      value: a list of null and of objects with the keys named for one
///
/// A code's bytes from 0x80 on show as the characters U+0080 to U+00FF; a class code of 0 as "<>".
KERNEL_API PropertyStreamReport DumpPropertyStream(InStream& in, nlohmann::ordered_json& json);

} // namespace Kernel
