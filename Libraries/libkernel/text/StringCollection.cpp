#include "libkernel/text/StringCollection.h"

#include "libkernel/core/Hash.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/OutSerialiser.h"

#include <vector>

namespace Kernel {

namespace {

constexpr IDTag c_default("defl");
constexpr IDTag c_keys("locK");
constexpr IDTag c_values("locV");

} // namespace

ClassProperties const StringCollection::ms_ClassProperties(ClassUID("LcLs"),
                                                           &ClassProperties::CreateNew<StringCollection>, 1, nullptr,
                                                           nullptr);
ClassPropertiesBase::Init const StringCollection::s_init(&StringCollection::ms_ClassProperties);

StringCollection::~StringCollection() = default;

void StringCollection::SetVariant(String8 const& key, String8 const& text)
{
    if (key.IsEmpty())
        m_default = text;
    else
        m_variants.insert_or_assign(key, text);
}

void StringCollection::UnsetVariant(String8 const& key)
{
    if (key.IsEmpty())
        m_default = String8();
    else
        m_variants.erase(key);
}

String8 StringCollection::GetVariant(String8 const& key, LookupMode mode) const
{
    if (key.IsEmpty() && mode != LookupMode::Exact) return m_default;
    auto found = m_variants.find(key);
    if (found == m_variants.end() && mode == LookupMode::English) found = m_variants.find("en");
    if (found != m_variants.end()) return found->second;
    return mode == LookupMode::Exact ? String8() : m_default;
}

void StringCollection::Save(OutSerialiser& out) const
{
    std::vector<String8> keys, values;
    keys.reserve(m_variants.size());
    values.reserve(m_variants.size());
    for (auto const& [key, value] : m_variants) {
        keys.push_back(key);
        values.push_back(value);
    }
    out.SaveType(c_default, m_default);
    out.SaveTypes(c_keys, keys);
    out.SaveTypes(c_values, values);
}

bool StringCollection::Load(InSerialiser const& in, FileStore&, unsigned short)
{
    std::vector<String8> keys, values;
    in.LoadType(c_default, m_default);
    in.LoadTypes(c_keys, keys);
    in.LoadTypes(c_values, values);
    if (keys.size() != values.size()) return false;
    for (size_t i = 0; i < keys.size(); ++i) m_variants.emplace(keys[i], values[i]);
    return true;
}

void StringCollection::AccumulateHash(HashAccumulator& hash) const
{
    AddToHash(hash, m_default);
    for (auto const& [key, value] : m_variants) {
        AddToHash(hash, key);
        AddToHash(hash, value);
    }
}

bool StringCollection::CompareMembers(Serialisable const& other, CompareContext const&) const
{
    return *this == static_cast<StringCollection const&>(other);
}

} // namespace Kernel
