#include "libkernel/streams/FileStreamBase.h"

#include "StreamTestSupport.h"
#include "libkernel/platform/Errors.h"
#include "libkernel/streams/FastFileInStream.h"
#include "libkernel/streams/FastFileOutStream.h"
#include "libkernel/streams/FileInOutStream.h"
#include "libkernel/streams/FileInStream.h"
#include "libkernel/streams/FileOutStream.h"
#include "support/FaultyFiles.h"
#include "support/FileFixture.h"

#include <functional>

namespace Kernel {
namespace {

using namespace Test;
using TestSupport::Fault;
using TestSupport::FaultyFiles;
using TestSupport::FileCall;
using TestSupport::ReadWholeFile;
using TestSupport::WriteWholeFile;
using Reason = FileIOException::Reason;

/// Notes what it is told, and takes itself off the stream and throws if asked to.
class Handler : public FileStreamErrorHandler
{
public:
    ~Handler() override = default;
    void OnError(Reason reason, bool fatal) override
    {
        reasons.push_back(reason);
        EXPECT_TRUE(fatal);
        if (!leave) return;
        leave->SetErrorHandler(nullptr);
        throw 42;
    }

    std::vector<Reason> reasons;
    FileStreamBase* leave = nullptr;
};

template <class S>
S& As(Countable& stream)
{
    return dynamic_cast<S&>(stream);
}

char g_bytes[8192];

// A failure that a stream must report once, and survive, and an operation in which it strikes every stream that has it.
// The operation answers whether it saw what a failure should give.
struct FaultCase
{
    Fault fault;
    std::function<bool(Countable&)> canFail;
    std::function<bool(Countable&)> failing;
};

template <class S>
FaultCase Case(Fault const& fault, bool (*step)(S&))
{
    return {fault, [](Countable& stream) { return dynamic_cast<S*>(&stream) != nullptr; },
            [step](Countable& stream) { return step(As<S>(stream)); }};
}

std::vector<FaultCase> MakeFaultCases()
{
    using In = InStreamSeekable;
    using Out = OutStreamSeekable;
    Fault const eio{.call = FileCall::Read, .error = EIO};
    Fault const half{.call = FileCall::Read, .error = EIO, .part = Fault::Part::Half};
    Fault const full{.call = FileCall::Write, .error = ENOSPC};
    Fault const device{.call = FileCall::Flush, .error = EIO};
    Fault const setSize{.call = FileCall::SetSize, .error = EIO};
    Fault const getSize{.call = FileCall::GetSize, .error = EACCES};
    return {
        Case<In>(eio, [](In& s) { return s.ReadBlock(g_bytes, 4) == 0; }),
        Case<In>(half, [](In& s) { return s.ReadBlock(g_bytes, 4900) < 4900; }),
        Case<In>(half, [](In& s) { return !s.CopyToStream(*MakeCounted<PlainTarget>()); }),
        Case<In>(getSize, [](In& s) { return s.GetSizeInStream() == 0; }),
        Case<In>(getSize, [](In& s) { return !s.Seek(SeekMethod::End, 0); }),
        Case<OutStream>(full, [](OutStream& s) { return s.WriteBlock(g_bytes, 8192) < 8192; }),
        Case<OutStream>(full, [](OutStream& s) { return s.WriteBlock(g_bytes, 4) == 0 || !s.Flush(); }),
        Case<OutStream>(device, [](OutStream& s) { return !s.ForceFlush(); }),
        Case<OutStream>(getSize, [](OutStream& s) { return s.GetSizeOutStream() == 0; }),
        Case<Out>(full, [](Out& s) { return s.WriteBlock(g_bytes, 4) == 0 || !s.Seek(SeekMethod::Beginning, 0); }),
        Case<Out>(full, [](Out& s) { return !s.WriteBlockAtPos(1, g_bytes, 2); }),
        Case<Out>(setSize, [](Out& s) { return !s.Truncate(10); }),
        Case<FileInOutStream>(setSize, [](FileInOutStream& s) { return !s.Recreate(); }),
    };
}

class FileStreamBaseTest : public TestSupport::FileFixture
{
protected:
    FileStreamBaseTest() { WriteWholeFile(m_path, Pattern(5000)); }

    /// The size of a broken stream's file can't change any more, nor can anything else be got out of it.
    void ExpectBroken(Countable& stream, Reason reason)
    {
        FileStreamBase& base = As<FileStreamBase>(stream);
        EXPECT_TRUE(base.IsBroken());
        EXPECT_EQ(base.GetReason(), reason);
        m_faults.ResetCounts();
        if (auto* in = dynamic_cast<InStreamSeekable*>(&stream)) {
            EXPECT_EQ(in->ReadBlock(g_bytes, 1), 0u);
            EXPECT_FALSE(in->Seek(SeekMethod::End, 0));
            EXPECT_FALSE(in->EOS()) << "or a copy from here would look complete";
            EXPECT_EQ(in->GetSizeInStream(), 0u);
        }
        if (auto* out = dynamic_cast<OutStream*>(&stream)) {
            EXPECT_EQ(out->WriteBlock(g_bytes, 8192), 0u);
            EXPECT_TRUE(out->Flush() && out->ForceFlush()); // The device is not asked again, which might say yes.
        }
        for (FileCall const call : {FileCall::Read, FileCall::Write, FileCall::Flush, FileCall::GetSize})
            EXPECT_EQ(m_faults.GetCount(call), 0) << "a broken stream touches no file";
    }

    FaultyFiles m_faults;
};

TEST_F(FileStreamBaseTest, TheFirstFailureIsThrownOnceOrToldToTheHandler)
{
    using Open = Counted<Countable> (*)(char const* path);
    static constexpr Open c_opens[] = {
        [](char const* p) { return Counted<Countable>(FileInStream::Open(p)); },
        [](char const* p) { return Counted<Countable>(FastFileInStream::Open(p, 0)); },
        [](char const* p) { return Counted<Countable>(FileOutStream::Append(p)); },
        [](char const* p) { return Counted<Countable>(FastFileOutStream::Append(p, 0)); },
        [](char const* p) { return Counted<Countable>(FileInOutStream::Open(p)); },
    };
    std::vector<FaultCase> const cases = MakeFaultCases();
    for (size_t i = 0; i < std::size(c_opens) * cases.size() * 2; ++i) {
        FaultCase const& c = cases[i / 2 % cases.size()];
        bool const handles = i % 2 == 1;
        size_t const kind = i / 2 / cases.size();
        SCOPED_TRACE(testing::Message() << "stream " << kind << " case " << i / 2 % cases.size() << " " << handles);
        WriteWholeFile(m_path, Pattern(5000));
        Counted<Countable> stream = c_opens[kind](m_path.c_str());
        if (!c.canFail(*stream)) continue;
        auto handler = MakeCounted<Handler>();
        if (handles) As<FileStreamBase>(*stream).SetErrorHandler(handler);
        m_faults.Plan(c.fault);
        Reason const reason = FileIOException::FromError(c.fault.error);
        try {
            EXPECT_TRUE(c.failing(*stream));
            EXPECT_TRUE(handles) << "nothing was thrown";
        } catch (FileIOException const& e) {
            EXPECT_EQ(e.GetReason(), reason);
            EXPECT_FALSE(handles);
        }
        EXPECT_TRUE(m_faults.HasFired());
        m_faults.Clear();
        ExpectBroken(*stream, reason);
        EXPECT_EQ(handler->reasons.size(), handles ? 1u : 0u);
        std::string const left = ReadWholeFile(m_path);
        stream.Reset();
        EXPECT_EQ(ReadWholeFile(m_path), left) << "a broken stream writes nothing more when it goes";
        EXPECT_EQ(m_faults.GetOpenHandles(), 0);
    }
}

TEST_F(FileStreamBaseTest, AHandlerMayThrowAndTakeItselfOff)
{
    Counted<FileInOutStream> stream = FileInOutStream::Open(m_path.c_str());
    auto handler = MakeCounted<Handler>();
    handler->leave = stream.Get();
    stream->SetErrorHandler(handler);
    handler.Reset(); // Only the stream holds it, and it lets go in the middle of the call.
    m_faults.Plan({.call = FileCall::Write, .error = EIO});
    EXPECT_THROW(stream->WriteBlock("x", 1), int);
    EXPECT_TRUE(stream->IsBroken());
}

TEST_F(FileStreamBaseTest, AShortWriteWithoutAnErrorIsACountWhereTheCallerSeesIt)
{
    Fault const shortWrite{.call = FileCall::Write, .part = Fault::Part::Half};
    m_faults.Plan(shortWrite);
    Counted<FileInOutStream> both = FileInOutStream::Open(m_path.c_str());
    EXPECT_EQ(both->WriteBlock(g_bytes, 100), 50u);
    EXPECT_FALSE(both->IsBroken());
    EXPECT_EQ(both->Tell(), 50u);

    // Bytes that were taken and then lost are another matter.
    Counted<FileOutStream> held = FileOutStream::Create((m_folder / "held").c_str());
    EXPECT_EQ(held->WriteBlock(g_bytes, 100), 100u);
    m_faults.Plan(shortWrite);
    try {
        held->Flush();
        ADD_FAILURE() << "the loss went unreported";
    } catch (FileIOException const& e) {
        EXPECT_EQ(e.GetReason(), Reason::NoError);
    }
}

TEST_F(FileStreamBaseTest, CloseWritesWhatIsHeldAndClosesWhateverFails)
{
    struct Case
    {
        char const* what;
        Fault fault;
        Reason reason;
    };
    for (Case const& c : {Case{"the last write", {.call = FileCall::Write, .error = ENOSPC}, Reason::OutOfSpace},
                          Case{"the close itself", {.call = FileCall::Close, .error = EIO}, Reason::FileHandleLost}})
        for (bool const byDestructor : {false, true})
            for (bool const fast : {false, true}) {
                SCOPED_TRACE(std::string(c.what) + (fast ? ", fast" : ", plain"));
                std::string const path = m_folder / "out";
                Counted<Countable> stream = fast ? Counted<Countable>(FastFileOutStream::Create(path.c_str(), 0))
                                                 : Counted<Countable>(FileOutStream::Create(path.c_str()));
                auto handler = MakeCounted<Handler>();
                As<FileStreamBase>(*stream).SetErrorHandler(handler);
                Write(As<OutStream>(*stream), "abc");
                m_faults.Plan(c.fault);
                if (byDestructor) {
                    stream.Reset();
                    EXPECT_TRUE(handler->reasons.empty()) << "a destructor reports nothing";
                } else {
                    EXPECT_FALSE(As<FileWriterBase>(*stream).Close());
                    EXPECT_EQ(handler->reasons, (std::vector<Reason>{c.reason}));
                    EXPECT_TRUE(As<FileStreamBase>(*stream).IsClosed());
                    EXPECT_TRUE(As<FileWriterBase>(*stream).Close()) << "closed already";
                }
                EXPECT_TRUE(m_faults.HasFired());
                m_faults.Clear();
                EXPECT_EQ(m_faults.GetOpenHandles(), 0);
            }
}

TEST_F(FileStreamBaseTest, AClosedStreamAnswersWithoutAFile)
{
    Counted<FileInOutStream> both = FileInOutStream::Open(m_path.c_str());
    Counted<FileInStream> in = FileInStream::Open(m_path.c_str());
    Counted<FastFileInStream> fastIn = FastFileInStream::Open(m_path.c_str(), 0);
    EXPECT_TRUE(both->Close() && in->Close() && fastIn->Close());
    for (InStreamSeekable* s : std::vector<InStreamSeekable*>{both.Get(), in.Get(), fastIn.Get()}) {
        EXPECT_EQ(s->ReadBlock(g_bytes, 10) + s->GetSizeInStream(), 0u);
        EXPECT_TRUE(!s->Rewind() && s->EOS());
    }
    EXPECT_EQ(both->WriteBlock("x", 1), 0u);
    EXPECT_FALSE(both->Truncate(0) || both->Recreate() || both->UpdateTimestamps() || both->IsBroken());
    EXPECT_TRUE(both->Flush() && both->ForceFlush() && both->Close());
}

TEST_F(FileStreamBaseTest, FilesCopyByTheGeneralLoopAndHandOverToOthers)
{
    std::string const text = Pattern((1 << 20) + 100);
    WriteWholeFile(m_path, text);
    ProgressLog log;
    auto memory = MakeCounted<MemoryInOutStream>();
    EXPECT_TRUE(FileInStream::Open(m_path.c_str())->CopyToStream(*memory, &log));
    EXPECT_TRUE(Content(*memory) == text);
    EXPECT_EQ(log.reports.size(), 2u) << "the memory stream's own copy, in pieces because the file is slow";

    std::string const target = m_folder / "target";
    auto expectCopied = [&](char const* what, std::function<bool()> const& copy) {
        EXPECT_TRUE(copy()) << what; // The streams are gone when it returns, so their last bytes are written.
        EXPECT_TRUE(ReadWholeFile(target) == text) << what;
    };
    expectCopied("fast to fast", [&] {
        return FastFileOutStream::Create(target.c_str(), 0)->CopyFromStream(*FastFileInStream::Open(m_path.c_str(), 0));
    });
    expectCopied("both to plain", [&] {
        return FileInOutStream::OpenReadOnly(m_path.c_str())->CopyToStream(*FileOutStream::Create(target.c_str()));
    });
    memory->Rewind();
    expectCopied("memory to file", [&] { return FileInOutStream::Create(target.c_str())->CopyFromStream(*memory); });
}

} // namespace
} // namespace Kernel
