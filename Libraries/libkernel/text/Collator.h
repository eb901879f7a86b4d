#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"

struct UCollator;

namespace Kernel {

class Locale;

/// Orders texts as a language does (Unicode Technical Standard 10, through ICU). Belongs to one thread at a time.
/// Making one loads the language's rules, so make it once for a list.
class KERNEL_API Collator : public Countable
{
public:
    /// A null or unknown locale gives the order of the root; what is no identifier at all opens no rules. @p numeric
    /// orders runs of digits by their value.
    Collator(Counted<Locale const> const& locale, bool caseSensitive, bool numeric);
    Collator(Collator const&) = delete;
    Collator& operator=(Collator const&) = delete;

    /// Case apart, texts still differ by their accents.
    void SetCaseSensitive(bool caseSensitive);
    void SetNumericOrdering(bool numeric);

    /// Negative, 0 or positive as @p a stands before, beside or behind @p b. Any bytes: what isn't UTF-8 counts as
    /// U+FFFD. Where no rules could be opened: the order of the code units, with case folded unless case counts.
    int Collate(String8 const& a, String8 const& b) const;

    /// True if the rules of ICU are in use.
    bool IsLocaleAware() const { return m_collator != nullptr; }

private:
    ~Collator() override;

    UCollator* m_collator; // Owned; null if none could be opened.
    bool m_caseSensitive;
};

} // namespace Kernel
