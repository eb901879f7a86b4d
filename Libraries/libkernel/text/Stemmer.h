#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"

struct sb_stemmer;

namespace Kernel {

class Locale;

/// Cuts words down to their stems, so that a search for one form finds the others. Belongs to one thread at a time.
///
/// Languages, by the identifier up to its "-", or else its "_": ar ca da de el en es eu fi fr ga hi hu id it lt ne nl
/// no pt ro ru sr sv ta tr; libstemmer also knows their three-letter codes, their English names and "porter".
class KERNEL_API Stemmer : public Countable
{
public:
    /// A null locale, or one in another language, gives a stemmer that leaves words as they are; so does a want of
    /// memory in libstemmer.
    explicit Stemmer(Counted<Locale const> const& locale);
    Stemmer(Stemmer const&) = delete;
    Stemmer& operator=(Stemmer const&) = delete;

    /// The stem of @p word, in lower case; the word itself where there is no stemmer. Text that
    /// is not valid UTF-8 gives some stem.
    String8 Stem(String8 const& word) const;

    /// False if words are left as they are.
    bool IsValid() const { return m_stemmer != nullptr; }

private:
    ~Stemmer() override;

    sb_stemmer* const m_stemmer; // Owned; may be null.
};

} // namespace Kernel
