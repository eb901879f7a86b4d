#pragma once

#include "libkernel/core/Hash.h"
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/CompareContext.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "support/PlainStreams.h"
#include "support/PropertyBytes.h"

#include <atomic>
#include <functional>
#include <gtest/gtest.h>
#include <limits>
#include <string>
#include <string_view>

namespace KernelTest {

using namespace Kernel;
using Kernel::Test::Bytes;
using Kernel::Test::PlainTarget;
using Kernel::Test::Show;

using SaveFunction = std::function<void(OutSerialiser&)>;

/// An object whose properties and description the test gives.
class Thing : public Serialisable
{
public:
    explicit Thing(ClassProperties const* description, SaveFunction save = {}, int value = 0)
        : m_description(description), m_save(std::move(save)), m_value(value)
    {
    }
    void Save(OutSerialiser& out) const override
    {
        if (m_save) m_save(out);
    }
    bool Load(InSerialiser const&, FileStore&, unsigned short) override { return false; }
    ClassProperties const* GetObjectClassProperties() const override { return m_description; }
    bool CompareMembers(Serialisable const& other, CompareContext const&) const override
    {
        return m_value == static_cast<Thing const&>(other).m_value;
    }

    ClassProperties const* m_description;
    SaveFunction m_save;
    int m_value;

protected:
    ~Thing() override = default;
};

/// The same for a shared object, which is told from others by its value. It saves the low byte of that as Valu.
class SharedThing : public SharedSerialisable
{
public:
    SharedThing(SharedClassProperties const* description, int value, SaveFunction save = {})
        : m_description(description), m_value(value), m_save(std::move(save))
    {
        ++s_alive;
    }
    void Save(OutSerialiser& out) const override
    {
        out.SaveType("Valu", static_cast<u8>(m_value));
        if (m_save) m_save(out);
    }
    bool Load(InSerialiser const&, FileStore&, unsigned short) override { return false; }
    void AccumulateHash(HashAccumulator& hash) const override { hash.AddToHash(&m_value, sizeof(m_value)); }
    SharedClassProperties const* GetObjectClassProperties() const override { return m_description; }
    bool CompareMembers(SharedSerialisable const& other, CompareContext const&) const override
    {
        return m_value == static_cast<SharedThing const&>(other).m_value;
    }
    void OnConsolidated() const override { ++m_consolidations; }

    SharedClassProperties const* m_description;
    int m_value;
    SaveFunction m_save;
    mutable int m_consolidations = 0;
    static inline std::atomic<int> s_alive{0};

protected:
    ~SharedThing() override { --s_alive; }
};

inline ClassProperties MakeClass(ClassUID uid, std::vector<Defaults::Item> const& defaults = {Defaults::Item()},
                                 ClassPropertiesBase const* parent = nullptr)
{
    return ClassProperties(uid, static_cast<ClassProperties::CreateFunc>(nullptr), 2, defaults.data(), parent);
}

inline SharedClassProperties MakeSharedClass(ClassUID uid,
                                             std::vector<Defaults::Item> const& defaults = {Defaults::Item()})
{
    return SharedClassProperties(uid, static_cast<SharedClassProperties::CreateFunc>(nullptr), 1, defaults.data(),
                                 nullptr);
}

inline Consolidated<SharedSerialisable> MakeShared(SharedClassProperties const& description, int value,
                                                   SaveFunction save = {})
{
    return description.ConsolidateObjectSacrifice(MakeCounted<SharedThing>(&description, value, std::move(save)));
}

/// The root list that @p save makes, with its closing 0 and without the file header.
inline std::string SaveList(SaveFunction const& save)
{
    auto const stream = MakeCounted<PlainTarget>();
    OutSerialiserFile out(*stream, IDTag("Test"), 1);
    save(out);
    out.Close();
    return stream->bytes.substr(16);
}

/// The code of the SaveException that @p save throws; -1 if there was none.
inline int SaveCode(std::function<void()> const& save)
{
    try {
        save();
    } catch (OutSerialiser::SaveException const& failure) {
        return failure.GetCode();
    }
    return -1;
}

inline int ListCode(SaveFunction const& save)
{
    return SaveCode([&] { SaveList(save); });
}

} // namespace KernelTest
