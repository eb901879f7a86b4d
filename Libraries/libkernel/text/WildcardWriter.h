#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"
#include "libkernel/text/Wildcard.h"

#include <unordered_map>

namespace Kernel {

class OutStream;
class WildcardSequence;

/// Writes template texts with their wildcards filled in. Each wildcard object is evaluated once in a writer's life, so
/// a token that stands twice in one text, or in two texts, gets one value. Belongs to one thread.
class KERNEL_API WildcardWriter
{
public:
    enum class State
    {
        NotEvaluated = 0,
        Good = 1,  ///< Evaluated.
        Failed = 2 ///< Nobody has a value for it.
    };

    /// Gives values; the application's.
    class KERNEL_API Evaluator
    {
    public:
        virtual ~Evaluator();
        /// Sets @p value and is true if there is a value for the wildcard.
        virtual bool Evaluate(NonCounted<Wildcard const> wildcard, String8& value) = 0;
    };

    /// Takes the text, piece by piece.
    class KERNEL_API Target
    {
    public:
        virtual ~Target();
        virtual void WriteString(String8 const& text) = 0;
    };

    /// Both are borrowed and outlive the writer.
    WildcardWriter(Evaluator& evaluator, Target& target) : m_evaluator(evaluator), m_target(target) {}
    /// Writes to the parent's target, and asks the parent for what @p evaluator has no value for. The parent is
    /// borrowed and outlives the writer.
    WildcardWriter(Evaluator& evaluator, WildcardWriter& parent)
        : m_evaluator(evaluator), m_target(parent.m_target), m_parent(&parent)
    {
    }
    WildcardWriter(WildcardWriter const&) = delete;
    WildcardWriter& operator=(WildcardWriter const&) = delete;

    /// Writes the items in order. A wildcard without a value writes nothing.
    void WriteSequence(WildcardSequence const& sequence);

private:
    struct Entry
    {
        Counted<Wildcard const> wildcard; // Kept, so that no other object comes to stand at its address.
        String8 value;
        State state = State::NotEvaluated;
    };

    State EvaluateWildcard(NonCounted<Wildcard const> wildcard, String8& value);

    Evaluator& m_evaluator;
    Target& m_target;
    WildcardWriter* const m_parent = nullptr; // May be null.
    std::unordered_map<Wildcard const*, Entry> m_entries;
};

/// Gathers the text in a string.
class KERNEL_API WildcardTargetString : public WildcardWriter::Target
{
public:
    ~WildcardTargetString() override;
    void WriteString(String8 const& text) override;
    String8 const& GetResult() const { return m_result; }

private:
    String8 m_result;
};

/// Writes the bytes of the text to a stream, without terminators.
class KERNEL_API WildcardTargetStream : public WildcardWriter::Target
{
public:
    /// The stream is borrowed and outlives the target.
    explicit WildcardTargetStream(OutStream& stream) : m_stream(stream) {}
    ~WildcardTargetStream() override;
    /// What the stream throws passes through.
    void WriteString(String8 const& text) override;
    /// True if the stream has taken fewer bytes than it was given.
    bool HasFailed() const { return m_hasFailed; }

private:
    OutStream& m_stream;
    bool m_hasFailed = false;
};

} // namespace Kernel
