#include "Diagnostics.h"
#include "OpenedArchive.h"
#include "ProgressBar.h"
#include "Verbs.h"
#include "WriteSession.h"
#include "libkernel/archive/ArchiveThumbnails.h"
#include "libkernel/platform/PlatformFile.h"
#include "libkernel/streams/OutStream.h"

#include <cstring>

namespace KernelTool {

using namespace Kernel;

namespace {

/// An item that is written back as it was read.
class BytesItem : public FileStoreItem
{
public:
    void Save(OutStream& stream, FileStoreOut&) const override
    {
        if (stream.WriteBlock(bytes.data(), bytes.size()) != bytes.size()) throw OutStream::WriteException();
    }
    bool Load(InStream&, FileStore&) override { return false; }
    FileStoreItemType const* GetObjectFileStoreItemType() const override;

    std::vector<u8> bytes;
};

Counted<FileStoreItem> CreateBytesItem()
{
    return MakeCounted<BytesItem>();
}

FileStoreItemType const c_bytesType(ClassUID("ktBy"), CreateBytesItem, FileStoreItemType::NotNestable,
                                    FileStoreItemType::NotRecoverable);

FileStoreItemType const* BytesItem::GetObjectFileStoreItemType() const
{
    return &c_bytesType;
}

/// Thumbnails alone are no revision, so the smallest item is written again with the bytes that it has.
void SetThumbnail(Archive& archive, String8 const& imagePath, Arguments const& arguments)
{
    std::vector<u8> const image = ReadWholeFile(imagePath);
    auto const data = MakeCounted<RawData>(image.size());
    if (!image.empty()) {
        if (!data->GetData()) throw MakeFailure("setting the thumbnail", Archive::OpenNoMemory);
        std::memcpy(data->GetData(), image.data(), image.size());
    }
    auto const thumbnails = MakeCounted<ArchiveThumbnails>();
    thumbnails->AddFile(ArchiveThumbnails::FileType::Picture, data);

    std::vector<String8> paths;
    archive.GetFileList(paths);
    String8 smallest;
    Archive::FileRevision chosen;
    for (String8 const& path : paths) {
        Archive::FileRevision entry;
        Counted<Archive::Revision const> revision;
        if (!archive.GetFileRevision(path, entry, revision)) continue;
        if (!smallest.IsEmpty() && entry.fileSize >= chosen.fileSize) continue;
        smallest = path;
        chosen = entry;
    }
    if (smallest.IsEmpty()) {
        Failure failure = MakeFailure("setting the thumbnail", Archive::OpenNotFound);
        failure.advice = "A thumbnail goes with a save: put an item into the document first.";
        throw failure;
    }
    auto const item = MakeCounted<BytesItem>();
    ReadItem(archive, smallest, [&](void const* bytes, u64 count) {
        auto const* const first = static_cast<u8 const*>(bytes);
        item->bytes.insert(item->bytes.end(), first, first + count);
    });
    Counted<FileStoreCompressionHint> hint;
    if (chosen.GetMethod() != Archive::FileRevision::Method::Direct)
        hint = MakeCounted<FileStoreCompressionHintGeneral>(FileStoreCompressionHintGeneral::CompressionLevelDefault,
                                                            chosen.GetPredictor(), chosen.GetStriping());
    LongWork work("Writing", image.size(), arguments);
    WriteSession session(archive, Archive::SessionTypeRewrite, archive.HasScratchFile());
    session->SetThumbnails(thumbnails);
    session->CreateFile(smallest, item, hint);
    session.Commit(false);
}

void GetThumbnail(ArchiveThumbnails::Rec const& rec, std::string const& path)
{
    auto const* const bytes = static_cast<char const*>(rec.data->GetData());
    if (path == "-") {
        Print(std::string(bytes ? bytes : "", rec.data->GetSize()));
        return;
    }
    std::string const what = "writing '" + path + "'";
    Platform::OpenFlags flags;
    flags.write = flags.create = flags.truncate = true;
    Platform::FileHandle handle = Platform::c_noHandle;
    int error = Platform::GetFileCalls().open(path.c_str(), flags, handle);
    if (error != 0) throw MakeFailure(what, File::TranslateOpenError(error, path.c_str()));
    error = Platform::GetFileCalls().write(handle, bytes, rec.data->GetSize()).error;
    int const closed = Platform::GetFileCalls().close(handle);
    if (error == 0) error = closed;
    if (error != 0) throw MakeFailure(what, FileIOException::FromError(error));
}

} // namespace

int RunThumbnail(Arguments const& arguments)
{
    bool const set = arguments.Has(Option::Set);
    bool const get = arguments.Has(Option::Get);
    if (set && get) throw UsageProblem{"--set and --get exclude each other"};
    if (get && arguments.Has(Option::Json) && arguments.Get(Option::Get) == "-")
        throw UsageProblem{"--json and a picture on standard output exclude each other"};
    Counted<Archive> const archive = set ? OpenForWriting(arguments.At(0)) : OpenForReading(arguments);
    if (set) SetThumbnail(*archive, arguments.GetString(Option::Set), arguments);
    Counted<ArchiveThumbnails const> const thumbnails = archive->LoadThumbnails();
    Json list = Json::array();
    if (thumbnails)
        for (ArchiveThumbnails::Rec const& rec : thumbnails->GetRecs())
            list.push_back({{"type", static_cast<int>(rec.type)}, {"size", rec.data->GetSize()}});
    if (get) {
        if (list.empty()) throw MakeFailure("reading the thumbnail", Archive::OpenNotFound);
        GetThumbnail(thumbnails->GetRecs().front(), arguments.Get(Option::Get));
        if (arguments.Get(Option::Get) == "-") return ExitDone;
    }
    if (arguments.Has(Option::Json)) {
        PrintJson({{"thumbnails", list}});
        return ExitDone;
    }
    std::string text = list.empty() ? "no thumbnail\n" : "";
    for (Json const& row : list) text += "thumbnail of " + FormatSize(row["size"].get<u64>()) + "\n";
    Print(text);
    return ExitDone;
}

} // namespace KernelTool
