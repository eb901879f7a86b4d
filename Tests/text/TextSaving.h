#pragma once

#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "libkernel/streams/MemoryStreams.h"
#include "serialisation/WriterTestSupport.h"

namespace Kernel::Test {

using KernelTest::Bytes;
using KernelTest::SaveFunction;
using KernelTest::SaveList;
using KernelTest::Show;

/// The properties that @p save writes, read back.
inline Counted<InSerialiserFile> Parsed(SaveFunction const& save)
{
    auto const stream = MakeCounted<KernelTest::BytesOutStream>();
    OutSerialiserFile out(*stream, IDTag("Test"), 1);
    save(out);
    out.Close();
    auto const in = MakeCounted<MemoryInStream>(stream->m_bytes.data(), stream->m_bytes.size(), true);
    return InSerialiserFile::ParseWithChecks(*in);
}

/// From four characters.
inline IDTag TagOf(char const* text)
{
    return IDTag({text[0], text[1], text[2], text[3], 0});
}

/// An inline class of LStr without a property.
struct EmptyClass
{
    static ClassUID GetClassUID() { return ClassUID("LStr"); }
    static unsigned short GetSchemaVersion() { return 1; }
    void Save(OutSerialiser&) const {}
};

} // namespace Kernel::Test
