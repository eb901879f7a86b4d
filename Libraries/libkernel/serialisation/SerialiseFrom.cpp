#include "libkernel/serialisation/SerialiseFrom.h"

#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/SharedSerialisable.h"
#include "libkernel/streams/FastFileInStream.h"
#include "libkernel/streams/FileInStream.h"
#include "libkernel/streams/ZipInStream.h"

namespace Kernel {

namespace {

constexpr u64 c_fileBufferSize = 1u << 20;
constexpr IDTag c_rootTag("Item");

} // namespace

bool SerialiseFromStream(Counted<InStream> in, IDTag fileTag, unsigned short maxVersion,
                         std::function<bool(InSerialiser&, IDTag)> load)
{
    if (!in || !load) return false;
    try {
        Counted<InSerialiserFile> const file = InSerialiserFile::ParseWithChecks(*in);
        if (!file) return false;
        if (auto const* const fileStream = dynamic_cast<FileInStream const*>(in.Get()))
            file->SetFilePath(fileStream->GetPath());
        if (file->GetFileIDTag() != fileTag || file->GetFileVersion() > maxVersion) return false;
        return load(*file, c_rootTag);
    } catch (...) {
        return false;
    }
}

bool SerialiseFromFile(char const* path, IDTag fileTag, unsigned short maxVersion,
                       std::function<bool(InSerialiser&, IDTag)> load, bool compressed)
{
    if (!path) return false;
    try {
        Counted<InStream> in = FastFileInStream::Open(path, c_fileBufferSize);
        if (in && compressed)
            in = ZipInStream::Create(in, CompressionPredictorType::None, CompressionPredictorStripingType::None, false);
        return SerialiseFromStream(in, fileTag, maxVersion, std::move(load));
    } catch (...) {
        return false;
    }
}

} // namespace Kernel
