#include "SourceItem.h"

#include "Diagnostics.h"
#include "Interrupt.h"
#include "Output.h"
#include "ProgressBar.h"
#include "libkernel/archive/ArchiveRevision.h"
#include "libkernel/core/Exception.h"
#include "libkernel/filestore/FileStoreOut.h"
#include "libkernel/filesystem/FileSystem.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/File.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <vector>

namespace KernelTool {

using namespace Kernel;

namespace {

constexpr u64 c_pieceSize = 1 << 20;

Counted<FileStoreItem> CreateNothing()
{
    return nullptr;
}

FileStoreItemType const c_type(ClassUID("ktSo"), CreateNothing, FileStoreItemType::NotNestable,
                               FileStoreItemType::NotRecoverable);

int KeepOpen(std::FILE*)
{
    return 0;
}

} // namespace

Source Source::FromPath(String8 const& path)
{
    Source source;
    source.m_name = "'" + ToStd(path) + "'";
    Platform::FileInfo info;
    int const error = Platform::GetFileCalls().stat(path.GetData(), true, info);
    if (error == 0 && info.kind == Platform::FileKind::Other) {
        Stream const in(std::fopen(path.GetData(), "rb"), std::fclose);
        if (!in) throw MakeFailure("reading " + source.m_name, File::TranslateOpenError(errno, path.GetData()));
        source.Spool(in.get());
        return source;
    }
    source.m_path = path;
    source.Open(); // So that what can't be read is told before anything is written.
    source.m_size = info.size;
    return source;
}

Source Source::FromStandardInput()
{
    Source source;
    source.m_name = "standard input";
    source.Spool(stdin);
    return source;
}

void Source::Spool(std::FILE* in)
{
    m_spool.reset(std::tmpfile(), [](std::FILE* file) {
        if (file) std::fclose(file);
    });
    if (!m_spool) throw MakeFailure("copying " + m_name, FileIOException::FromError(errno));
    std::vector<u8> piece(c_pieceSize);
    for (;;) {
        StopIfInterrupted();
        size_t const got = std::fread(piece.data(), 1, piece.size(), in);
        if (std::fwrite(piece.data(), 1, got, m_spool.get()) != got)
            throw MakeFailure("copying " + m_name, FileIOException::FromError(errno));
        m_size += got;
        if (got == piece.size()) continue;
        if (std::ferror(in)) throw MakeFailure("reading " + m_name, FileIOException::FromError(errno));
        return;
    }
}

Source::Stream Source::Open() const
{
    if (m_spool) {
        std::rewind(m_spool.get());
        return Stream(m_spool.get(), KeepOpen);
    }
    std::FILE* file = nullptr;
    auto const result = File::OpenUnmanaged(m_path.GetData(), File::AccessMode::Read, File::ShareMode::DenyNone,
                                            File::VisibilityMode::Normal, file);
    if (!file) throw MakeFailure("reading " + m_name, result);
    return Stream(file, std::fclose);
}

u64 Source::Read(Stream const& stream, void* to, u64 count) const
{
    u64 const got = std::fread(to, 1, count, stream.get());
    if (got != count && std::ferror(stream.get()))
        throw MakeFailure("reading " + m_name, FileIOException::FromError(errno));
    return got;
}

bool HasSameBytes(Archive& archive, String8 const& path, Source const& source, LongWork& work)
{
    Archive::FileRevision entry;
    Counted<Archive::Revision const> revision;
    if (!archive.GetFileRevision(path, entry, revision) || entry.fileSize != source.GetSize()) return false;
    u64 const pieceSize = std::min(c_pieceSize, std::max<u64>(entry.fileSize, 1));
    std::vector<u8> stored(pieceSize);
    std::vector<u8> wanted(pieceSize);
    Source::Stream const in = source.Open();
    try {
        Counted<InStream> const stream = archive.OpenFileInStream(path);
        if (!stream) return false;
        for (;;) {
            u64 const a = stream->ReadBlock(stored.data(), pieceSize);
            u64 const b = source.Read(in, wanted.data(), pieceSize);
            if (a != b || std::memcmp(stored.data(), wanted.data(), a) != 0) return false;
            work.Advance(a);
            if (a < pieceSize) return true;
        }
    } catch (AbortException const&) {
        throw;
    } catch (Exception const&) {
        // Stored bytes that can't be read back want to be written again.
        return false;
    }
}

SourceItem::~SourceItem() = default;

void SourceItem::Save(OutStream& stream, FileStoreOut& out) const
{
    Source::Stream const in = m_source.Open();
    std::vector<u8> piece(std::min(c_pieceSize, std::max<u64>(m_source.GetSize(), 1)));
    for (;;) {
        out.TestAbort();
        u64 const got = m_source.Read(in, piece.data(), piece.size());
        if (stream.WriteBlock(piece.data(), got) != got) throw OutStream::WriteException();
        m_work.Advance(got);
        if (got < piece.size()) return;
    }
}

bool SourceItem::Load(InStream&, FileStore&)
{
    return false;
}

FileStoreItemType const* SourceItem::GetObjectFileStoreItemType() const
{
    return &c_type;
}

} // namespace KernelTool
