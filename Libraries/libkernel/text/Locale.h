#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"

namespace Kernel {

/// A user's language and country, by identifier. Never changes once made, so one may be read from any thread.
class KERNEL_API Locale : public Countable
{
public:
    /// Takes any identifier as it is, such as a BCP 47 tag; nothing is checked, and it may be empty.
    static Counted<Locale const> Create(String8 const& id);

    /// The user's own setting as a BCP 47 tag: ICU's default locale, which comes from the environment (LC_ALL,
    /// LC_MESSAGES, LANG). An empty identifier when there is none. A new object each time; nothing is kept here.
    static Counted<Locale const> GetCurrent();

    String8 const& GetId() const { return m_id; }
    /// The identifier in UTF-16, for calls of the system.
    String16 const& ToWin32Locale() const { return m_id16; }
    /// The identifier up to the first "-", or all of it when it has none.
    String8 GetISOCode() const;

    /// Two characters of a language in 16 bits: @p first in the high byte.
    static constexpr u16 EncodeLanguage(char first, char second)
    {
        return static_cast<u16>(static_cast<u8>(first) << 8 | static_cast<u8>(second));
    }
    /// The first two bytes of the identifier so encoded; 0 when it has fewer.
    u16 GetEncodedLanguage() const;

    /// True for equal identifiers. The number has no meaning here; generic comparisons with a tolerance pass one.
    bool IsEqual(Locale const& other, double tolerance) const;

private:
    explicit Locale(String8 const& id);
    ~Locale() override;

    String8 const m_id;
    String16 const m_id16;
};

} // namespace Kernel
