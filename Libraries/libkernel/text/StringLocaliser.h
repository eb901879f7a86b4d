#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// Asks the application for translations. The sink is a plain pointer: set it at start, before other threads ask.
class KERNEL_API StringLocaliser
{
public:
    /// Gives the text to show for @p base; @p context tells equal base texts apart. Called on the asking thread.
    using LocalisationSink = String8 (*)(String8 const& base, String8 const& context);

    static StringLocaliser& GetInstance();

    /// Null takes the sink away.
    void SetLocalisationSink(LocalisationSink sink) { m_sink = sink; }
    /// The sink's answer, empty if that is its answer; @p base itself while there is no sink.
    String8 Localise(String8 const& base, String8 const& context) const;

private:
    StringLocaliser() = default;

    LocalisationSink m_sink = nullptr;
};

} // namespace Kernel
