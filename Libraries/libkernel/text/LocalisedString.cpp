#include "libkernel/text/LocalisedString.h"

#include "libkernel/serialisation/FutureVersionException.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/text/StringLocaliser.h"

namespace Kernel {

namespace {

constexpr IDTag c_base("Str_");
constexpr IDTag c_context("Ctxt");
constexpr IDTag c_localised("LStr");

// A negative length means up to the terminator.
String8 TextOf(char const* text, int length)
{
    return length < 0 ? String8(text) : String8(text, length);
}

} // namespace

LocalisedString const LocalisedString::Empty;

LocalisedString::LocalisedString(char const* base, int baseLength, char const* context, int contextLength)
    : m_context(TextOf(context, contextLength)), m_base(TextOf(base, baseLength))
{
}

LocalisedString LocalisedString::CreateFakeFromString(String8 const& text)
{
    LocalisedString result;
    result.m_localised = text;
    return result;
}

LocalisedString LocalisedString::RecreateFromString(String8 const& base, String8 const& context)
{
    return LocalisedString(base.GetData(), base.GetLength(), context.GetData(), context.GetLength());
}

String8 const& LocalisedString::ToString() const
{
    if (m_localised.IsEmpty() && !m_base.IsEmpty())
        m_localised = StringLocaliser::GetInstance().Localise(m_base, m_context);
    return m_localised;
}

void LocalisedString::Untranslate()
{
    if (!IsFake()) m_localised = String8();
}

void LocalisedString::Save(OutSerialiser& out) const
{
    if (IsFake()) {
        out.SaveType(c_localised, m_localised);
        return;
    }
    out.SaveType(c_base, m_base);
    out.SaveType(c_context, m_context);
    if (!m_localised.IsEmpty() && m_localised != m_base) out.SaveType(c_localised, m_localised);
}

bool LocalisedString::Load(InSerialiser const& in, ClassUID const&, unsigned short)
{
    String8 base, context, localised;
    bool const hasText = in.LoadType(c_localised, localised);
    if (!in.LoadType(c_base, base) || !in.LoadType(c_context, context)) {
        if (!hasText) return false;
        *this = CreateFakeFromString(localised);
        return true;
    }
    *this = RecreateFromString(base, context);
    if (hasText && ToString().IsEmpty()) m_localised = localised;
    return true;
}

bool LocalisedString::LoadWithFallback(InSerialiser const& in, IDTag const& classTag, IDTag const& stringTag)
{
    ClassUID classUID;
    unsigned short version = 0;
    Counted<InSerialiser const> const nested = in.LoadClassI(classTag, classUID, version);
    if (nested && classUID == GetClassUID()) {
        if (!Load(*nested, classUID, version)) throw FutureVersionException(true);
        return true;
    }
    return in.LoadType(stringTag, m_localised);
}

} // namespace Kernel
