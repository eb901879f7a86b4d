// W4: a tree of 100,000 objects with 8 properties each, half of them at their defaults, written to memory and read back
// into native objects. Each save goes to a fresh growing buffer, as a save does. Peers get plain structs with standard
// strings and vectors; ours are counted objects with classes, defaults and back references. The destruction of what was
// read is not timed.
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/Defaults.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "libkernel/serialisation/Serialisable.h"
#include "libkernel/streams/MemoryStreams.h"
#include "support/Table.h"

#include <cstring>
#include <ctime>
#include <functional>
#include <malloc.h>
#include <memory>
#include <optional>
#ifdef KERNEL_HAVE_MSGPACK
#include <msgpack.hpp>
#endif
#ifdef KERNEL_HAVE_CEREAL
#include <cereal/archives/binary.hpp>
#include <cereal/types/memory.hpp>
#include <cereal/types/string.hpp>
#include <cereal/types/vector.hpp>
#include <sstream>
#endif
#ifdef KERNEL_HAVE_PROTOBUF_GRAPH
#include "ObjectGraph.pb.h"
#endif

namespace {

using namespace Kernel;

constexpr u32 c_objects = 100'000;
constexpr u32 c_fanOut = 10;
#ifndef BENCH_ROUNDS
#define BENCH_ROUNDS 15
#endif
constexpr int c_rounds = BENCH_ROUNDS;

// Ours grows by doubling, as the peers' buffers do.
class GrowingStream : public MemoryInOutStreamBase
{
protected:
    u64 GetNewCapacity(u64 capacity, u64 required) const override
    {
        return std::max({2 * capacity, required, u64(8192)});
    }
};

// Ours.

class Node : public Serialisable
{
public:
    void Save(OutSerialiser& out) const override
    {
        out.SaveType("Iden", id);
        out.SaveType("Name", name);
        out.SaveType("PosX", x);
        out.SaveType("Kind", kind);
        out.SaveType("PosY", y);
        out.SaveType("PosZ", z);
        out.SaveType("Styl", style);
        out.SaveType("Hide", hidden);
        if (!kids.empty()) out.SaveObjects("Kids", kids);
    }
    bool Load(InSerialiser const& in, FileStore&, unsigned short) override
    {
        if (in.HasProperty("Kids") && !in.LoadObjects("Kids", kids)) return false;
        return in.LoadType("Iden", id) && in.LoadType("Name", name) && in.LoadType("PosX", x) &&
               in.LoadType("Kind", kind) && in.LoadType("PosY", y) && in.LoadType("PosZ", z) &&
               in.LoadType("Styl", style) && in.LoadType("Hide", hidden);
    }
    ClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }
    static ClassPropertiesBase::DefaultItem const* __GetDefaultSerialisation()
    {
        static auto const s_items =
            Defaults::Make(Defaults::Value("PosY", 0.0), Defaults::Value("PosZ", 0.0),
                           Defaults::Text("Styl", String8("Regular")), Defaults::Bool("Hide", false));
        return s_items.data();
    }

    u32 id = 0;
    String8 name;
    double x = 0;
    u16 kind = 0;
    double y = 0;
    double z = 0;
    String8 style;
    bool hidden = false;
    std::vector<Counted<Node>> kids;

    static ClassProperties const ms_ClassProperties;
    static ClassPropertiesBase::Init const s_init;

protected:
    ~Node() override = default;
};

ClassProperties const Node::ms_ClassProperties("BnNd", &ClassProperties::CreateNew<Node>, 1,
                                               Node::__GetDefaultSerialisation(), nullptr);
ClassPropertiesBase::Init const Node::s_init(&Node::ms_ClassProperties);

// The peers' model.
struct Plain
{
    std::uint32_t id = 0;
    std::string name;
    double x = 0;
    std::uint16_t kind = 0;
    double y = 0;
    double z = 0;
    std::string style = "Regular";
    bool hidden = false;
    std::vector<std::unique_ptr<Plain>> kids;

    template <class Archive>
    void serialize(Archive& archive)
    {
        archive(id, name, x, kind, y, z, style, hidden, kids);
    }
};

std::string NameOf(u32 i)
{
    // As long as names are that people give, which no small string form holds.
    return "Curve object " + std::to_string(100 + i % 900);
}

template <class Make, class Attach>
auto BuildTree(Make make, Attach attach)
{
    std::vector<decltype(make(0u))> all;
    for (u32 i = 0; i < c_objects; ++i) all.push_back(make(i));
    // From the last one back, so that an owner is still there when its children come.
    for (u32 i = c_objects - 1; i > 0; --i) attach(all[(i - 1) / c_fanOut], all[i]);
    return std::move(all[0]);
}

Counted<Node> BuildOurs()
{
    return BuildTree(
        [](u32 i) {
            Counted<Node> node(new Node);
            node->id = i;
            std::string const name = NameOf(i);
            node->name = String8(name.c_str());
            node->x = i * 0.5;
            node->kind = static_cast<u16>(1 + i % 50);
            node->style = String8("Regular");
            return node;
        },
        [](Counted<Node>& owner, Counted<Node>& child) { owner->kids.insert(owner->kids.begin(), child); });
}

std::unique_ptr<Plain> BuildPlain()
{
    return BuildTree(
        [](u32 i) {
            auto node = std::make_unique<Plain>();
            node->id = i;
            node->name = NameOf(i);
            node->x = i * 0.5;
            node->kind = static_cast<u16>(1 + i % 50);
            return node;
        },
        [](std::unique_ptr<Plain>& owner, std::unique_ptr<Plain>& child) {
            owner->kids.insert(owner->kids.begin(), std::move(child));
        });
}

bool IsSame(Node const& a, Node const& b)
{
    if (a.id != b.id || !(a.name == b.name) || a.x != b.x || a.kind != b.kind || !(a.style == b.style) ||
        a.kids.size() != b.kids.size())
        return false;
    for (size_t i = 0; i < a.kids.size(); ++i)
        if (!IsSame(*a.kids[i], *b.kids[i])) return false;
    return true;
}

bool IsSame(Plain const& a, Plain const& b)
{
    if (a.id != b.id || a.name != b.name || a.x != b.x || a.kind != b.kind || a.style != b.style ||
        a.kids.size() != b.kids.size())
        return false;
    for (size_t i = 0; i < a.kids.size(); ++i)
        if (!IsSame(*a.kids[i], *b.kids[i])) return false;
    return true;
}

// Packed by hand: fields in order, presence bits for those that may be at their defaults.
namespace Packed {

template <class T>
void Put(std::vector<u8>& out, T value)
{
    size_t const at = out.size();
    out.resize(at + sizeof(T));
    std::memcpy(out.data() + at, &value, sizeof(T));
}
template <class T>
T Get(u8 const*& at)
{
    T value;
    std::memcpy(&value, at, sizeof(T));
    at += sizeof(T);
    return value;
}
void PutText(std::vector<u8>& out, std::string const& text)
{
    Put(out, static_cast<u8>(text.size()));
    out.insert(out.end(), text.begin(), text.end());
}

void Write(std::vector<u8>& out, Plain const& node)
{
    Put(out, static_cast<u8>((node.y != 0) | (node.z != 0) << 1 | (node.style != "Regular") << 2 | node.hidden << 3));
    Put(out, node.id);
    PutText(out, node.name);
    Put(out, node.x);
    Put(out, node.kind);
    if (node.y != 0) Put(out, node.y);
    if (node.z != 0) Put(out, node.z);
    if (node.style != "Regular") PutText(out, node.style);
    Put(out, static_cast<u32>(node.kids.size()));
    for (auto const& kid : node.kids) Write(out, *kid);
}

std::unique_ptr<Plain> Read(u8 const*& at)
{
    auto node = std::make_unique<Plain>();
    u8 const bits = Get<u8>(at);
    node->id = Get<u32>(at);
    u8 const length = Get<u8>(at);
    node->name.assign(reinterpret_cast<char const*>(at), length);
    at += length;
    node->x = Get<double>(at);
    node->kind = Get<u16>(at);
    if (bits & 1) node->y = Get<double>(at);
    if (bits & 2) node->z = Get<double>(at);
    if (bits & 4) {
        u8 const styleLength = Get<u8>(at);
        node->style.assign(reinterpret_cast<char const*>(at), styleLength);
        at += styleLength;
    }
    node->hidden = (bits & 8) != 0;
    node->kids.resize(Get<u32>(at));
    for (auto& kid : node->kids) kid = Read(at);
    return node;
}

} // namespace Packed

#ifdef KERNEL_HAVE_MSGPACK
namespace Msgpack {

using Packer = msgpack::packer<msgpack::sbuffer>;

void Key(Packer& out, char const* key)
{
    u32 const length = static_cast<u32>(std::strlen(key));
    out.pack_str(length);
    out.pack_str_body(key, length);
}

void Write(Packer& out, Plain const& node)
{
    out.pack_map(4u + (node.y != 0) + (node.z != 0) + (node.style != "Regular") + node.hidden + !node.kids.empty());
    Key(out, "id");
    out.pack(node.id);
    Key(out, "name");
    out.pack(node.name);
    Key(out, "x");
    out.pack(node.x);
    Key(out, "kind");
    out.pack(node.kind);
    if (node.y != 0) Key(out, "y"), out.pack(node.y);
    if (node.z != 0) Key(out, "z"), out.pack(node.z);
    if (node.style != "Regular") Key(out, "style"), out.pack(node.style);
    if (node.hidden) Key(out, "hidden"), out.pack(node.hidden);
    if (node.kids.empty()) return;
    Key(out, "kids");
    out.pack_array(static_cast<u32>(node.kids.size()));
    for (auto const& kid : node.kids) Write(out, *kid);
}

std::unique_ptr<Plain> Read(msgpack::object const& object)
{
    auto node = std::make_unique<Plain>();
    for (u32 i = 0; i < object.via.map.size; ++i) {
        msgpack::object_kv const& entry = object.via.map.ptr[i];
        std::string_view const key(entry.key.via.str.ptr, entry.key.via.str.size);
        if (key == "id")
            entry.val.convert(node->id);
        else if (key == "name")
            entry.val.convert(node->name);
        else if (key == "x")
            entry.val.convert(node->x);
        else if (key == "kind")
            entry.val.convert(node->kind);
        else if (key == "y")
            entry.val.convert(node->y);
        else if (key == "z")
            entry.val.convert(node->z);
        else if (key == "style")
            entry.val.convert(node->style);
        else if (key == "hidden")
            entry.val.convert(node->hidden);
        else if (key == "kids") {
            node->kids.resize(entry.val.via.array.size);
            for (u32 k = 0; k < entry.val.via.array.size; ++k) node->kids[k] = Read(entry.val.via.array.ptr[k]);
        }
    }
    return node;
}

} // namespace Msgpack
#endif

#ifdef KERNEL_HAVE_PROTOBUF_GRAPH
namespace Proto {

void Fill(bench::Node& message, Plain const& node)
{
    message.set_id(node.id);
    message.set_name(node.name);
    message.set_x(node.x);
    message.set_kind(node.kind);
    message.set_y(node.y);
    message.set_z(node.z);
    if (node.style != "Regular") message.set_style(node.style);
    message.set_hidden(node.hidden);
    for (auto const& kid : node.kids) Fill(*message.add_kids(), *kid);
}

std::unique_ptr<Plain> Take(bench::Node& message)
{
    auto node = std::make_unique<Plain>();
    node->id = message.id();
    node->name = std::move(*message.mutable_name());
    node->x = message.x();
    node->kind = static_cast<u16>(message.kind());
    node->y = message.y();
    node->z = message.z();
    if (!message.style().empty()) node->style = message.style();
    node->hidden = message.hidden();
    for (int i = 0; i < message.kids_size(); ++i) node->kids.push_back(Take(*message.mutable_kids(i)));
    return node;
}

} // namespace Proto
#endif

// Everybody starts from a heap that is warm and tidy: otherwise one pays for what another has dropped.
void KeepHeap()
{
    mallopt(M_MMAP_THRESHOLD, 1 << 30);
    mallopt(M_TRIM_THRESHOLD, 1 << 30);
}
void TidyHeap()
{
    void* volatile large = std::malloc(1 << 20);
    std::free(large);
}

struct Figures
{
    char const* name;
    double bytes = 0;
    double write = 1e300;
    double read = 1e300;
};

// The thread's own time: the work waits for nothing, and other load on the machine counts less.
double Now()
{
    timespec time;
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

// One subject: how to write, and how to read into something that is dropped outside the time taken.
struct Subject
{
    Figures figures;
    std::function<void()> drop;                  // Lets go of what was written before.
    std::function<u64()> write;                  // Gives the bytes written.
    std::function<std::function<bool()>()> read; // Gives a check of what was read, which also drops it.
};

} // namespace

// With arguments, only the subjects whose names begin with one of them.
int main(int argc, char** argv)
{
    KeepHeap();
    Counted<Node> const ours = BuildOurs();
    std::unique_ptr<Plain> const plain = BuildPlain();
    std::vector<Subject> subjects;

    Counted<GrowingStream> out;
    subjects.push_back({{"libkernel"},
                        [&] { out.Reset(); },
                        [&] {
                            out = new GrowingStream;
                            OutSerialiserFile file(*out, "Bnch", 1);
                            file.SaveObject("Item", ours);
                            file.Close();
                            return static_cast<MemoryInOutStreamBase&>(*out).GetSize();
                        },
                        [&]() -> std::function<bool()> {
                            MemoryInStream* const in = new MemoryInStream(
                                out->GetBuffer(), static_cast<MemoryInOutStreamBase&>(*out).GetSize(), false);
                            Counted<InStream> const keep(in);
                            Counted<InSerialiserFile> const file = InSerialiserFile::ParseWithChecks(*in);
                            Counted<Node> root;
                            if (file) file->LoadObject("Item", root);
                            return [root, &ours] { return root && IsSame(*root, *ours); };
                        }});

    std::vector<u8> packed;
    subjects.push_back({{"packed by hand (limit)"},
                        [&] { packed = {}; },
                        [&] {
                            Packed::Write(packed, *plain);
                            return packed.size();
                        },
                        [&]() -> std::function<bool()> {
                            u8 const* at = packed.data();
                            std::shared_ptr<Plain> const root = Packed::Read(at);
                            return [root, &plain] { return IsSame(*root, *plain); };
                        }});
#ifdef KERNEL_HAVE_MSGPACK
    std::optional<msgpack::sbuffer> packs;
    subjects.push_back({{"msgpack-cxx, maps"},
                        [&] { packs.reset(); },
                        [&] {
                            packs.emplace();
                            Msgpack::Packer packer(*packs);
                            Msgpack::Write(packer, *plain);
                            return packs->size();
                        },
                        [&]() -> std::function<bool()> {
                            msgpack::object_handle const handle = msgpack::unpack(packs->data(), packs->size());
                            std::shared_ptr<Plain> const root = Msgpack::Read(handle.get());
                            return [root, &plain] { return IsSame(*root, *plain); };
                        }});
#endif
#ifdef KERNEL_HAVE_CEREAL
    std::optional<std::stringstream> cereals;
    subjects.push_back({{"cereal binary"},
                        [&] { cereals.reset(); },
                        [&] {
                            cereals.emplace();
                            cereal::BinaryOutputArchive archive(*cereals);
                            archive(plain);
                            return static_cast<u64>(cereals->tellp());
                        },
                        [&]() -> std::function<bool()> {
                            cereal::BinaryInputArchive archive(*cereals);
                            std::unique_ptr<Plain> read;
                            archive(read);
                            std::shared_ptr<Plain> const root = std::move(read);
                            return [root, &plain] { return IsSame(*root, *plain); };
                        }});
#endif
#ifdef KERNEL_HAVE_PROTOBUF_GRAPH
    std::string proto;
    subjects.push_back({{"Protobuf, to native"},
                        [&] { proto = {}; },
                        [&] {
                            bench::Node message;
                            Proto::Fill(message, *plain);
                            message.AppendToString(&proto);
                            return proto.size();
                        },
                        [&]() -> std::function<bool()> {
                            bench::Node message;
                            message.ParseFromString(proto);
                            std::shared_ptr<Plain> const root = Proto::Take(message);
                            return [root, &plain] { return IsSame(*root, *plain); };
                        }});
#endif

    if (argc > 1) {
        std::erase_if(subjects, [&](Subject const& subject) {
            return std::none_of(argv + 1, argv + argc, [&](char const* wanted) {
                return std::strncmp(subject.figures.name, wanted, std::strlen(wanted)) == 0;
            });
        });
    }

    // Rounds go round the subjects, so that a disturbed moment hits all.
    for (int round = 0; round < c_rounds; ++round) {
        for (Subject& subject : subjects) {
            subject.drop();
            TidyHeap();
            double start = Now();
            subject.figures.bytes = static_cast<double>(subject.write()) / c_objects;
            subject.figures.write = std::min(subject.figures.write, Now() - start);
            TidyHeap();
            start = Now();
            std::function<bool()> check = subject.read();
            subject.figures.read = std::min(subject.figures.read, Now() - start);
            if (!check()) {
                std::fprintf(stderr, "%s read something else than it wrote\n", subject.figures.name);
                return 1;
            }
        }
    }

    double peerWrite = 0;
    double peerRead = 0;
    for (Subject const& subject : subjects) {
        if (std::strncmp(subject.figures.name, "msgpack", 7) != 0) continue;
        peerWrite = subject.figures.write * 1e9 / c_objects;
        peerRead = subject.figures.read * 1e9 / c_objects;
    }
    Bench::Table table("W4 object graph: 100,000 objects of 8 properties, half at default");
    for (Subject const& subject : subjects)
        table.Row("write", subject.figures.name, subject.figures.write * 1e9 / c_objects, "ns/obj", peerWrite,
                  std::strcmp(subject.figures.name, "libkernel") == 0 ? "<= 1.00 x msgpack" : "");
    for (Subject const& subject : subjects)
        table.Row("read", subject.figures.name, subject.figures.read * 1e9 / c_objects, "ns/obj", peerRead,
                  std::strcmp(subject.figures.name, "libkernel") == 0 ? "<= 0.95 x msgpack and cereal" : "");
    for (Subject const& subject : subjects) table.Row("size", subject.figures.name, subject.figures.bytes, "B/obj");
    return 0;
}
