#pragma once

#include "libkernel/core/IDTag.h"
#include "libkernel/core/String.h"

namespace Kernel {

class InSerialiser;
class OutSerialiser;

/// A text of the program that is translated when it is first shown. The translation is kept, so ToString writes to a
/// const value: a value is shared between threads only once it has been resolved, or if it is fake or empty.
///
/// Saved as an inline class: a fake string as LStr alone, any other as Str_ and Ctxt, with LStr beside them if there is
/// a translation that differs from the base.
class KERNEL_API LocalisedString
{
public:
    /// The empty string.
    static LocalisedString const Empty;

    LocalisedString() = default;
    /// A text that needs no translation, such as a name that the user gave.
    static LocalisedString CreateFakeFromString(String8 const& text);
    /// The text as the source code says it, and a word that tells a translator where it stands.
    static LocalisedString RecreateFromString(String8 const& base, String8 const& context);

    String8 const& GetContext() const { return m_context; }
    String8 const& GetBaseString() const { return m_base; }

    /// The text to show: the translation that was kept, otherwise the answer of the StringLocaliser, which is kept. The
    /// reference is good until this value is changed or dies.
    String8 const& ToString() const;
    operator String8() const { return ToString(); }

    bool IsEmpty() const { return m_base.IsEmpty() && m_localised.IsEmpty(); }
    bool IsFake() const { return m_base.IsEmpty() && m_context.IsEmpty() && !m_localised.IsEmpty(); }
    /// Forgets the translation, so that the next ToString asks again: for a change of language. Leaves a fake string as
    /// it is.
    void Untranslate();

    /// Equal base and context; without a context the kept texts count too, which tells fake strings apart.
    friend bool operator==(LocalisedString const& a, LocalisedString const& b)
    {
        return a.m_base == b.m_base && a.m_context == b.m_context &&
               (!a.m_context.IsEmpty() || a.m_localised == b.m_localised);
    }

    static ClassUID GetClassUID() { return ClassUID("LStr"); }
    static unsigned short GetSchemaVersion() { return 1; }
    void Save(OutSerialiser& out) const;
    /// The running language wins: a stored translation counts only where the StringLocaliser answers with an empty
    /// text. False, with the value as it was, if there is neither a base with its context nor a text.
    bool Load(InSerialiser const& in, ClassUID const& classUID, unsigned short version);
    /// For fields that were plain strings in older files: the class under @p classTag, otherwise the string under
    /// @p stringTag, which becomes the localised text and leaves base and context alone. Says whether either was there.
    /// Throws FutureVersionException if the class is there but can't be loaded.
    bool LoadWithFallback(InSerialiser const& in, IDTag const& classTag, IDTag const& stringTag);

private:
    LocalisedString(char const* base, int baseLength, char const* context, int contextLength);

    String8 m_context;
    String8 m_base;
    mutable String8 m_localised; // Filled on first use.
};

} // namespace Kernel
