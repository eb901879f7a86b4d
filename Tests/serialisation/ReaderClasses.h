#pragma once

#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/serialisation/Serialisable.h"
#include "libkernel/serialisation/SharedSerialisable.h"
#include "libkernel/streams/InStream.h"
#include "support/PropertyBytes.h"

#include <set>
#include <vector>

namespace Kernel::Test {

// Classes that the reader's tests read. Each reads what stands there and does without the rest.

/// RdNo: the properties Numb, Name, Chld (owned), Refr (referred to), Kids, Shrd; refuses to load with Refu.
class ReaderNode : public Serialisable
{
public:
    ReaderNode();
    void Save(OutSerialiser& out) const override;
    bool Load(InSerialiser const& in, FileStore& store, unsigned short version) override;
    ClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }
    /// Lets go of everything it holds, so that a circle ends.
    void Drop();
    /// The same for all that are left over: damaged streams make circles.
    static void DropAll();

    u32 number = 0;
    String8 name;
    Counted<ReaderNode> child;
    Counted<Serialisable> reference;
    std::vector<Counted<ReaderNode>> kids;
    Consolidated<SharedSerialisable> shared;
    unsigned short version = 0;
    bool numberIsDefault = false; // The list itself has no Numb.
    bool isLoaded = false;
    bool sawUnloaded = false; // What it refers to was not loaded yet.
    bool tookWrongClass = false;

    static ClassProperties const ms_ClassProperties;
    static int s_alive;

protected:
    ~ReaderNode() override;

private:
    static std::set<ReaderNode*> s_all;
};

/// RdDv, with the parent RdNo: its own class and the parent's properties.
class ReaderDerived : public ReaderNode
{
public:
    ClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }
    static ClassProperties const ms_ClassProperties;
};

/// RdLg, made by a legacy function that reads Numb.
class ReaderLegacy : public ReaderNode
{
public:
    explicit ReaderLegacy(u32 made) : madeWith(made) {}
    ClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }
    u32 const madeWith;
    static ClassProperties const ms_ClassProperties;
};

/// RdSh: a shared value with the number Numb, and Next, another one. s_hash replaces the hash if not 0.
class ReaderShared : public SharedSerialisable
{
public:
    void Save(OutSerialiser& out) const override;
    bool Load(InSerialiser const& in, FileStore& store, unsigned short version) override;
    void AccumulateHash(HashAccumulator& hash) const override;
    SharedClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }
    static SharedClassProperties const* GetTypeSharedClassProperties() { return &ms_ClassProperties; }
    bool CompareMembers(SharedSerialisable const& other, CompareContext const& context) const override;

    u32 number = 0;
    Consolidated<SharedSerialisable> next;

    static SharedClassProperties const ms_ClassProperties;
    static bool s_hashesAlike;

protected:
    ~ReaderShared() override = default;
};

/// How the bytes reach the parse.
enum class Delivery
{
    Memory,
    Seekable,
    Sized,
    Unsized
};
inline constexpr Delivery c_deliveries[] = {Delivery::Memory, Delivery::Seekable, Delivery::Sized, Delivery::Unsized};

Counted<InStream> Deliver(std::vector<u8> const& bytes, Delivery delivery);
Counted<InSerialiserFile> Parse(std::vector<u8> const& bytes, bool checks = true, Delivery delivery = Delivery::Memory);
/// A file with these items, in the notation of Bytes(), behind a header and with an end.
Counted<InSerialiserFile> ParseItems(std::string_view notation);
/// Items of every form but objects, in every size of the forms that have many, or only in some.
PropertyBytes EveryValueForm();
/// A whole stream with one of every form of item, and objects of the classes above.
PropertyBytes EveryItemForm();

} // namespace Kernel::Test
