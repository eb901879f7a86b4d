#include "libkernel/serialisation/SerialiseTo.h"

#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "libkernel/streams/FileOutStream.h"
#include "libkernel/streams/ZipOutStream.h"

namespace Kernel {

namespace {

constexpr int c_deleteRetries = 0;

// Contents are on the device before the move, so that a crash leaves the old file or the whole new one.
bool WriteFile(FileOutStream& file, IDTag tag, unsigned short version, std::function<void(OutSerialiser&, IDTag)>& save,
               int level)
{
    try {
        if (level == 0) {
            if (!SerialiseToStream(&file, tag, version, std::move(save))) return false;
        } else {
            auto const zip = ZipOutStream::Create(&file, CompressionPredictorType::None, level);
            if (!zip || !SerialiseToStream(zip, tag, version, std::move(save)) || !zip->Finalise()) return false;
        }
        return file.ForceFlush();
    } catch (...) {
        return false;
    }
}

} // namespace

bool SerialiseToStream(Counted<OutStream> stream, IDTag tag, unsigned short version,
                       std::function<void(OutSerialiser&, IDTag)> save)
{
    if (!stream) return false;
    try {
        OutSerialiserFile out(*stream, tag, version);
        save(out, IDTag("Item"));
        out.Close();
        return true;
    } catch (...) {
        return false;
    }
}

bool SerialiseToFile(char const* path, IDTag tag, unsigned short version,
                     std::function<void(OutSerialiser&, IDTag)> save, int level)
{
    String8 const target(path);
    if (target.IsEmpty()) return false;
    String8 const temporary = target + "~temp";
    auto const file = FileOutStream::Create(temporary.GetData());
    if (!file) return false;
    bool const isWritten = WriteFile(*file, tag, version, save, level);
    bool const isClosed = file->Close();
    if (isWritten && isClosed && FileSystem::SafeMoveFile(temporary, target)) return true;
    FileSystem::Delete(temporary, c_deleteRetries);
    return false;
}

} // namespace Kernel
