#include "libkernel/text/StringLocaliser.h"

namespace Kernel {

StringLocaliser& StringLocaliser::GetInstance()
{
    static StringLocaliser s_instance;
    return s_instance;
}

String8 StringLocaliser::Localise(String8 const& base, String8 const& context) const
{
    return m_sink ? m_sink(base, context) : base;
}

} // namespace Kernel
