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

// Failures that each stream must report once, and survive. The operation gets a fresh stream on a file of 5,000 bytes
// and answers whether it saw what a failure should give.
struct FaultCase
{
    char const* what;
    Fault fault;
    Reason reason;
    std::function<Counted<Countable>(char const* path)> open;
    std::function<bool(Countable&)> failing;
};

template <class S>
S& As(Countable& stream)
{
    return dynamic_cast<S&>(stream);
}

template <class S>
std::function<bool(Countable&)> Call(bool (*step)(S&))
{
    return [step](Countable& stream) { return step(As<S>(stream)); };
}

char g_bytes[8192];

std::vector<FaultCase> MakeFaultCases()
{
    auto in = [](char const* p) { return Counted<Countable>(FileInStream::Open(p)); };
    auto fastIn = [](char const* p) { return Counted<Countable>(FastFileInStream::Open(p, 0)); };
    auto out = [](char const* p) { return Counted<Countable>(FileOutStream::Append(p)); };
    auto fastOut = [](char const* p) { return Counted<Countable>(FastFileOutStream::Append(p, 0)); };
    auto both = [](char const* p) { return Counted<Countable>(FileInOutStream::Open(p)); };

    auto read = Call<InStream>([](InStream& s) { return s.ReadBlock(g_bytes, 4) == 0; });
    auto readLots = Call<InStream>([](InStream& s) { return s.ReadBlock(g_bytes, 4900) < 4900; });
    auto copy = Call<InStream>([](InStream& s) { return !s.CopyToStream(*MakeCounted<PlainTarget>()); });
    auto write = Call<OutStream>([](OutStream& s) { return s.WriteBlock(g_bytes, 4) == 0; });
    auto writeLots = Call<OutStream>([](OutStream& s) { return s.WriteBlock(g_bytes, 8192) < 8192; });
    auto writeAndFlush = Call<OutStream>([](OutStream& s) { return s.WriteBlock(g_bytes, 4) == 4 && !s.Flush(); });
    auto toDevice = Call<OutStream>([](OutStream& s) { return !s.ForceFlush(); });
    auto truncate = Call<OutStreamSeekable>([](OutStreamSeekable& s) { return !s.Truncate(10); });
    auto size = Call<InStream>([](InStream& s) { return s.GetSizeInStream() == 0; });
    auto sizeOut = Call<OutStream>([](OutStream& s) { return s.GetSizeOutStream() == 0; });
    auto seekEnd = Call<InStreamSeekable>([](InStreamSeekable& s) { return !s.Seek(SeekMethod::End, 0); });
    auto seekWithBytes = Call<OutStreamSeekable>(
        [](OutStreamSeekable& s) { return s.WriteBlock(g_bytes, 4) == 4 && !s.Seek(SeekMethod::Beginning, 0); });
    auto patch = Call<OutStreamSeekable>([](OutStreamSeekable& s) { return !s.WriteBlockAtPos(1, g_bytes, 2); });
    auto recreate = Call<FileInOutStream>([](FileInOutStream& s) { return !s.Recreate(); });

    Fault const eio{.call = FileCall::Read, .error = EIO};
    Fault const half{.call = FileCall::Read, .error = EIO, .part = Fault::Part::Half};
    Fault const full{.call = FileCall::Write, .error = ENOSPC};
    Fault const device{.call = FileCall::Flush, .error = EIO};
    Fault const setSize{.call = FileCall::SetSize, .error = EIO};
    Fault const getSize{.call = FileCall::GetSize, .error = EACCES};
    Reason const lost = Reason::FileHandleLost;
    Reason const space = Reason::OutOfSpace;
    return {
        {"plain read", eio, lost, in, read},
        {"plain copy", half, lost, in, copy},
        {"plain size", getSize, Reason::AccessDenied, in, size},
        {"plain seek", getSize, Reason::AccessDenied, in, seekEnd},
        {"fast read", eio, lost, fastIn, read},
        {"fast read, half", half, lost, fastIn, readLots},
        {"fast copy", eio, lost, fastIn, copy},
        {"plain write past the buffer", full, space, out, writeLots},
        {"plain write held back", full, space, out, writeAndFlush},
        {"plain write, seek", full, space, out, seekWithBytes},
        {"plain write at a position", full, space, out, patch},
        {"plain device flush", device, lost, out, toDevice},
        {"plain truncate", setSize, lost, out, truncate},
        {"plain truncate, size", getSize, Reason::AccessDenied, out, truncate},
        {"plain size out", getSize, Reason::AccessDenied, out, sizeOut},
        {"fast write past the buffer", full, space, fastOut, writeLots},
        {"fast write held back", full, space, fastOut, writeAndFlush},
        {"fast device flush", device, lost, fastOut, toDevice},
        {"fast size out", getSize, Reason::AccessDenied, fastOut, sizeOut},
        {"in and out read", eio, lost, both, read},
        {"in and out copy", half, lost, both, copy},
        {"in and out write", full, space, both, write},
        {"in and out write at a position", full, space, both, patch},
        {"in and out device flush", device, lost, both, toDevice},
        {"in and out truncate", setSize, lost, both, truncate},
        {"in and out size", getSize, Reason::AccessDenied, both, size},
        {"in and out recreate", setSize, lost, both, recreate},
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
    for (FaultCase const& c : MakeFaultCases())
        for (bool const handles : {false, true}) {
            SCOPED_TRACE(c.what);
            WriteWholeFile(m_path, Pattern(5000));
            Counted<Countable> stream = c.open(m_path.c_str());
            auto handler = MakeCounted<Handler>();
            if (handles) As<FileStreamBase>(*stream).SetErrorHandler(handler);
            m_faults.Plan(c.fault);
            try {
                EXPECT_TRUE(c.failing(*stream));
                EXPECT_TRUE(handles) << "nothing was thrown";
            } catch (FileIOException const& e) {
                EXPECT_EQ(e.GetReason(), c.reason);
                EXPECT_FALSE(handles);
            }
            EXPECT_TRUE(m_faults.HasFired());
            m_faults.Clear();
            ExpectBroken(*stream, c.reason);
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
