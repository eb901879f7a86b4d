#include "libkernel/core/Limits.h"
#include "libkernel/filestore/BackstoreGuarantor.h"
#include "libkernel/filestore/FileStoreOutPathGenerator.h"
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "libkernel/streams/MemoryStreams.h"
#include "support/MemoryFileStore.h"
#include "support/Rows.h"

#include <gtest/gtest.h>

// Items whose bytes are property streams that refer to further items.

namespace {

using namespace KernelTest;
using Behaviour = InSerialiser::DelayLoadsBehaviour;

/// Refers to one item.
class Binder : public Serialisable
{
public:
    static ClassProperties const ms_ClassProperties;

    explicit Binder(Counted<DelayLoadHolder> p = nullptr) : part(std::move(p)) {}
    void Save(OutSerialiser& out) const override
    {
        FileStoreOutIndexedPathGenerator generator(out.GetFileStoreOut(), "b/", "");
        out.SaveDelayLoadObject("Part", part, generator, nullptr);
    }
    bool Load(InSerialiser const& in, FileStore&, unsigned short) override
    {
        return in.LoadDelayLoadObject("Part", part);
    }
    ClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }

    Counted<DelayLoadHolder> part;

protected:
    ~Binder() override = default;
};
ClassProperties const Binder::ms_ClassProperties("Bndr", &ClassProperties::CreateNew<Binder>, 1, nullptr, nullptr);
ClassPropertiesBase::Init const s_binder(&Binder::ms_ClassProperties);

/// An item that is a binder in a property stream.
class BinderItem : public FileStoreItem
{
public:
    static FileStoreItemType const s_type;
    static Behaviour s_behaviour;

    void Save(OutStream&, FileStoreOut&) const override {}
    bool Load(InStream& stream, FileStore& store) override
    {
        auto const file = InSerialiserFile::ParseWithChecks(stream, store, s_behaviour, {}, {});
        return file && file->LoadObject("Item", binder);
    }
    FileStoreItemType const* GetObjectFileStoreItemType() const override { return &s_type; }

    Counted<Binder> binder;

protected:
    ~BinderItem() override = default;
};
FileStoreItemType const BinderItem::s_type(
    ClassUID("TsBi"), [] { return Counted<FileStoreItem>(new BinderItem); }, FileStoreItemType::NotNestable,
    FileStoreItemType::IsRecoverableType);
FileStoreItemType::Init const s_binderType(BinderItem::s_type);
Behaviour BinderItem::s_behaviour = Behaviour::Leave;

class DelayLoadReferenceTest : public testing::Test
{
protected:
    Counted<DelayLoadHolder> Hold(String8 const& path)
    {
        return store->CreateDelayLoadHolderDirect(path, &BinderItem::s_type, nullptr);
    }
    /// Stores at @p path a binder that refers to what stands at @p part.
    void PutBinder(String8 const& path, String8 const& part)
    {
        auto const stream = MakeCounted<MemoryInOutStream>();
        RecordingOut out(*store);
        OutSerialiserFile file(*stream, out, IDTag("Bndr"), 1);
        file.SaveObject("Item", MakeCounted<Binder>(Hold(part)));
        file.Close();
        String8 bytes;
        u64 const size = stream->GetSizeOutStream();
        stream->Seek(0);
        ASSERT_EQ(size, stream->ReadBlock(bytes.SetLength(static_cast<int>(size)), size));
        store->Put(path.GetData(), bytes);
    }
    static Counted<BinderItem> Item(Counted<DelayLoadHolder> const& holder)
    {
        return CountedCast<BinderItem>(holder->GetItemBaseIfLoaded().GetCounted());
    }

    Counted<MemoryFileStore> store = MemoryFileStore::Create();
};

TEST_F(DelayLoadReferenceTest, ReferenceIsLeftProvenOrLoaded)
{
    PutBinder("inner", "opt/missing");
    PutBinder("outer", "inner");
    PutBinder("self", "self");
    for (auto const& [behaviour, loads, isLoaded] : Rows<Behaviour, int, bool>{
             {Behaviour::Leave, 1, false}, {Behaviour::Prove, 2, false}, {Behaviour::Load, 2, true}})
    {
        SCOPED_TRACE(static_cast<int>(behaviour));
        BinderItem::s_behaviour = behaviour;
        Counted<DelayLoadHolder> const outer = Hold("outer");
        JailCounted<FileStoreItem> item;
        store->loads = 0;
        ASSERT_TRUE(outer->GetItemBase(item));
        Counted<DelayLoadHolder> const inner = Item(outer)->binder->part;
        EXPECT_EQ(inner, Hold("inner"));
        EXPECT_EQ(isLoaded, inner->IsLoaded());
        EXPECT_EQ(loads, store->loads);
        EXPECT_TRUE(inner->GetItemBase(item));
        EXPECT_TRUE(Item(inner)->binder->part->IsDead()) << "the recoverable item that is not there";
        // In use, it stays with its holder, proven or not.
        JailCounted<FileStoreItem> again;
        EXPECT_TRUE(outer->ReleaseItem());
        ASSERT_TRUE(outer->GetItemBase(again));
        EXPECT_EQ(item.Get(), inner->GetItemBaseIfLoaded().Get());

        Counted<DelayLoadHolder> const self = Hold("self");
        store->loads = 0;
        EXPECT_TRUE(self->GetItemBase(again));
        EXPECT_EQ(1, store->loads) << "an item that names itself ends";
        EXPECT_EQ(self, Item(self)->binder->part);
        Item(self)->binder->part.Reset();
    }
}

TEST_F(DelayLoadReferenceTest, LoadsAndParsesCountTogetherAgainstTheLimit)
{
    BinderItem::s_behaviour = Behaviour::Load;
    auto const path = [](u32 i) { return String8(std::to_string(i).c_str()); };
    for (u32 i = 0; i < c_maxNesting; ++i) PutBinder(path(i), path(i + 1));
    std::vector<Counted<DelayLoadHolder>> holders;
    for (u32 i = 0; i < c_maxNesting; ++i) holders.push_back(Hold(path(i)));
    JailCounted<FileStoreItem> item;
    EXPECT_TRUE(holders[0]->GetItemBase(item));
    u32 loaded = 0;
    while (loaded < c_maxNesting && holders[loaded]->GetItemBaseIfLoaded()) ++loaded;
    EXPECT_GT(loaded, c_maxNesting / 8);
    EXPECT_LE(loaded, c_maxNesting / 2) << "each load has at least a parse of an object inside";
    for (auto const& holder : holders)
        if (Item(holder)) Item(holder)->binder->part.Reset();
}

TEST_F(DelayLoadReferenceTest, WhatAnObjectRefersToIsBackedBeforeItsStoreGoes)
{
    PutBinder("x", "opt/none");
    Counted<Binder> const binder = MakeCounted<Binder>(Hold("x"));
    EXPECT_TRUE(BackstoreGuarantor::Process(*binder));
    EXPECT_TRUE(binder->part->GetBackData());
    EXPECT_TRUE(BackstoreGuarantor::Process(*MakeCounted<Binder>()));
    EXPECT_FALSE(BackstoreGuarantor::Process(*MakeCounted<Binder>(Hold("opt/none"))));
}

} // namespace
