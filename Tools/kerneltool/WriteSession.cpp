#include "WriteSession.h"

#include "Diagnostics.h"
#include "Interrupt.h"
#include "SourceItem.h"
#include "libkernel/archive/ArchiveThumbnails.h"
#include "libkernel/streams/OutStream.h"

#include <limits>

namespace KernelTool {

using namespace Kernel;
using General = FileStoreCompressionHintGeneral;

namespace {

template <class T>
struct Choice
{
    char const* text;
    T value;
};

constexpr Choice<Archive::SessionType> c_types[] = {{"full", Archive::SessionTypeFull},
                                                    {"incremental", Archive::SessionTypeIncremental},
                                                    {"rewrite", Archive::SessionTypeRewrite},
                                                    {"export", Archive::SessionTypeExport}};
constexpr Choice<General::CompressionLevel> c_levels[] = {{"default", General::CompressionLevelDefault},
                                                          {"min", General::CompressionLevelMin},
                                                          {"max", General::CompressionLevelMax}};
constexpr Choice<CompressionPredictorType> c_predictors[] = {{"none", CompressionPredictorType::None},
                                                             {"8", CompressionPredictorType::UnsignedChar},
                                                             {"16", CompressionPredictorType::UnsignedShort},
                                                             {"32", CompressionPredictorType::UnsignedInt}};

template <class T, size_t n>
T Choose(Choice<T> const (&choices)[n], std::string const& text)
{
    for (Choice<T> const& choice : choices)
        if (text == choice.text) return choice.value;
    return choices[0].value;
}

} // namespace

WriteOptions::WriteOptions(Arguments const& arguments)
    : type(Choose(c_types, arguments.Get(Option::Session))), scratch(arguments.Has(Option::Scratch)),
      verify(arguments.Has(Option::Verify))
{
    std::string const level = arguments.Get(Option::Level);
    auto const striping = arguments.Has(Option::Striped) ? CompressionPredictorStripingType::Striping64k
                                                         : CompressionPredictorStripingType::None;
    if (level != "store")
        hint = MakeCounted<General>(Choose(c_levels, level), Choose(c_predictors, arguments.Get(Option::Predictor)),
                                    striping);
    if (arguments.Has(Option::UserData)) userData = ReadWholeFile(arguments.GetString(Option::UserData));
}

WriteSession::WriteSession(Archive& archive, Archive::SessionType type, bool scratch)
    : m_archive(archive), m_file(scratch ? Archive::ChoiceScratch : Archive::ChoiceMaster)
{
    Archive::CreateSessionResult result = Archive::SessionOk;
    if (!scratch) {
        result = archive.CreateSessionAdv(m_handle, type, GetAbortFlag(), false);
    } else if (!archive.HasScratchFile()) {
        result = Archive::SessionNoScratch;
    } else if (!archive.CreateScratchSession(m_handle, type, GetAbortFlag())) {
        result = archive.IsDead() ? Archive::SessionFileBad : Archive::SessionFileUnusable;
    }
    if (result != Archive::SessionOk) throw MakeFailure("starting the save", result);
    m_saveCount = GetSaveCount();
    m_handle->SetThumbnails(archive.LoadThumbnails());
}

u32 WriteSession::GetSaveCount() const
{
    Archive::FileState state;
    return m_archive.GetFileState(m_file, state) ? state.saveCount : 0;
}

void WriteSession::Commit(bool verify)
{
    if (verify) {
        String8 report;
        Archive::VerifyResult const result = m_archive.CloseSessionAndVerifyFileState(m_handle, report, true);
        Failure failure = MakeFailure("verifying the save", result);
        if (result == Archive::VerifyMismatch) failure.status = ExitDamaged;
        if (result != Archive::VerifyMatch) throw failure;
    } else {
        m_archive.CloseSession(m_handle, true);
    }
    if (GetSaveCount() != m_saveCount) return;
    StopIfInterrupted();
    throw OutStream::WriteException();
}

std::vector<u8> ReadWholeFile(String8 const& path)
{
    Source const source = Source::FromPath(path);
    if (source.GetSize() > std::numeric_limits<u32>::max())
        throw MakeFailure("reading " + source.GetName(), File::OpenUnmanagedResult::TooLarge);
    std::vector<u8> bytes(source.GetSize());
    Source::Stream const stream = source.Open();
    bytes.resize(source.Read(stream, bytes.data(), bytes.size()));
    return bytes;
}

} // namespace KernelTool
