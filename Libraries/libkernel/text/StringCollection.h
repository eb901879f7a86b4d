#pragma once

#include "libkernel/core/String.h"
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/Serialisable.h"

#include <map>

namespace Kernel {

/// One text in several language variants, and a default. Saved as the string defl, and the string arrays locK and locV
/// with the keys and the values in the order of the keys. One thread at a time.
class KERNEL_API StringCollection : public Serialisable
{
public:
    /// What GetVariant gives for an empty key, and for one that has no variant.
    enum class LookupMode
    {
        Exact = 0,   ///< The empty string; an empty key is a key like any other.
        Default = 1, ///< The default.
        English = 2  ///< The default for an empty key; otherwise the variant "en", or the default if there is none.
    };

    static ClassProperties const ms_ClassProperties;

    StringCollection() = default;

    void SetDefault(String8 const& text) { m_default = text; }
    String8 const& GetDefault() const { return m_default; }
    /// An empty key sets the default.
    void SetVariant(String8 const& key, String8 const& text);
    /// An empty key clears the default.
    void UnsetVariant(String8 const& key);
    /// The text for a language; @p mode says what stands in for one that has none.
    String8 GetVariant(String8 const& key, LookupMode mode) const;

    friend bool operator==(StringCollection const& a, StringCollection const& b)
    {
        return a.m_default == b.m_default && a.m_variants == b.m_variants;
    }

    void Save(OutSerialiser& out) const override;
    /// Takes the first value of a key that comes twice. Refuses arrays of different lengths.
    bool Load(InSerialiser const& in, FileStore& store, unsigned short version) override;
    void AccumulateHash(HashAccumulator& hash) const override;
    ClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }
    bool CompareMembers(Serialisable const& other, CompareContext const& context) const override;

protected:
    ~StringCollection() override;

private:
    static ClassPropertiesBase::Init const s_init;

    String8 m_default;
    std::map<String8, String8> m_variants;
};

} // namespace Kernel
