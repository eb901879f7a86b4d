#include "libkernel/text/WildcardWriter.h"

#include "libkernel/streams/OutStream.h"
#include "libkernel/text/WildcardSequence.h"

#include <algorithm>
#include <limits>

namespace Kernel {

WildcardWriter::Evaluator::~Evaluator() = default;

WildcardWriter::Target::~Target() = default;

void WildcardWriter::WriteSequence(WildcardSequence const& sequence)
{
    for (WildcardSequence::Item const& item : sequence.GetItems()) {
        if (!item.wildcard) {
            m_target.WriteString(item.literal);
            continue;
        }
        String8 value;
        if (EvaluateWildcard(item.wildcard, value) == State::Good) m_target.WriteString(value);
    }
}

WildcardWriter::State WildcardWriter::EvaluateWildcard(NonCounted<Wildcard const> wildcard, String8& value)
{
    // An evaluator may use the writer again; entries keep their place while others are added.
    Entry& entry = m_entries[wildcard.Get()];
    entry.wildcard = Counted<Wildcard const>(wildcard.Get());
    if (entry.state == State::NotEvaluated) {
        if (m_evaluator.Evaluate(wildcard, entry.value))
            entry.state = State::Good;
        else
            entry.state = m_parent ? m_parent->EvaluateWildcard(wildcard, entry.value) : State::Failed;
    }
    if (entry.state != State::Failed) value = entry.value;
    return entry.state;
}

WildcardTargetString::~WildcardTargetString() = default;

void WildcardTargetString::WriteString(String8 const& text)
{
    i64 const needed = i64{m_result.GetLength()} + text.GetLength();
    // Appending alone grows by exact need, which would copy the whole for each piece.
    if (!m_result.HasRoomFor(static_cast<int>(std::min<i64>(needed, std::numeric_limits<int>::max()))))
        m_result.Reserve(static_cast<int>(std::min<i64>(needed + needed / 2, std::numeric_limits<int>::max())));
    m_result.Append(text);
}

WildcardTargetStream::~WildcardTargetStream() = default;

void WildcardTargetStream::WriteString(String8 const& text)
{
    u64 const size = static_cast<u64>(text.GetLength());
    if (m_stream.WriteBlock(text.GetData(), size) != size) m_hasFailed = true;
}

} // namespace Kernel
