#include "libkernel/text/Stemmer.h"

#include "libkernel/text/Locale.h"
#include "libkernel/text/TextCase.h"

#include <libstemmer.h>
#include <new>

namespace Kernel {

namespace {

sb_stemmer* Open(String8 const& id)
{
    int end = id.Find('-');
    if (end < 0) end = id.Find('_');
    String8 const language = end < 0 ? id : id.GetSubstring(0, end);
    return sb_stemmer_new(language.GetData(), nullptr);
}

} // namespace

Stemmer::Stemmer(Counted<Locale const> const& locale) : m_stemmer(locale ? Open(locale->GetId()) : nullptr) {}

Stemmer::~Stemmer()
{
    sb_stemmer_delete(m_stemmer);
}

String8 Stemmer::Stem(String8 const& word) const
{
    if (!m_stemmer) return word;
    String8 const lower = ToLowerCase(word);
    sb_symbol const* const stem =
        sb_stemmer_stem(m_stemmer, reinterpret_cast<sb_symbol const*>(lower.GetData()), lower.GetLength());
    if (!stem) throw std::bad_alloc(); // Nothing else makes it null.
    return String8(reinterpret_cast<char const*>(stem), sb_stemmer_length(m_stemmer));
}

} // namespace Kernel
