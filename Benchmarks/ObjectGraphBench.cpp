// A tree of 100,000 objects with 8 properties each, half of them at their default, saved and loaded as a property
// stream and as the maps of a self-describing peer.
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "libkernel/streams/OutStream.h"
#include "support/Table.h"

#include <cstring>
#include <string_view>
#ifdef KERNEL_HAVE_MSGPACK
#include <msgpack.hpp>
#endif

namespace {

using namespace Kernel;

constexpr int c_objects = 100'000;
constexpr int c_fanOut = 8;
constexpr int c_rounds = 15;

class Node : public Serialisable
{
public:
    static ClassProperties const ms_ClassProperties;
    static ClassPropertiesBase::DefaultItem const* __GetDefaultSerialisation()
    {
        static auto const items =
            Defaults::Make(Defaults::Value("Colo", u32{0xFF000000}), Defaults::Bool("Visi", true),
                           Defaults::Value("Opac", 1.0f), Defaults::Text("Styl", "plain"), Defaults::Text("Name", ""));
        return items.data();
    }
    void Save(OutSerialiser& out) const override
    {
        out.SaveType("Iden", m_id);
        out.SaveType("PosX", m_x);
        out.SaveType("PosY", m_y);
        out.SaveType("Colo", m_colour);
        out.SaveType("Visi", m_isVisible);
        out.SaveType("Opac", m_opacity);
        out.SaveType("Styl", m_style);
        out.SaveType("Name", m_name);
        if (!m_children.empty()) out.SaveObjects("Chil", m_children);
    }
    bool Load(InSerialiser const&, FileStore&, unsigned short) override { return false; }
    ClassProperties const* GetObjectClassProperties() const override { return &ms_ClassProperties; }

    int m_id = 0;
    double m_x = 0;
    double m_y = 0;
    u32 m_colour = 0xFF000000;
    bool m_isVisible = true;
    float m_opacity = 1.0f;
    String8 m_style = "plain";
    String8 m_name;
    std::vector<Counted<Node>> m_children;
};

ClassProperties const Node::ms_ClassProperties("bNod", &ClassProperties::CreateNew<Node>, 1,
                                               Node::__GetDefaultSerialisation(), nullptr);
ClassPropertiesBase::Init s_init(&Node::ms_ClassProperties);

Counted<Node> MakeTree()
{
    String8 const style("plain");
    std::vector<Counted<Node>> all;
    for (int i = 0; i < c_objects; ++i) {
        auto const node = MakeCounted<Node>();
        node->m_id = i;
        node->m_x = i * 0.5;
        node->m_y = i * 0.25;
        node->m_style = style;
        char name[16];
        std::snprintf(name, sizeof name, "n%06d", i);
        node->m_name = name;
        if (i) all[static_cast<size_t>((i - 1) / c_fanOut)]->m_children.push_back(node);
        all.push_back(node);
    }
    return all[0];
}

/// Keeps its bytes in one block that grows by doubling and is used again.
class BlockOutStream : public OutStream
{
public:
    u64 WriteBlock(void const* from, u64 count) override
    {
        if (m_size + count > m_block.size()) m_block.resize(std::max<size_t>(m_block.size() * 2, m_size + count));
        std::memcpy(m_block.data() + m_size, from, count);
        m_size += count;
        return count;
    }
    u64 GetSizeOutStream() const override { return m_size; }
    u64 TellOutStream() const override { return m_size; }

    std::vector<char> m_block;
    u64 m_size = 0;
};

void WriteTree(Node const& root, BlockOutStream& stream)
{
    stream.m_size = 0;
    OutSerialiserFile out(stream, "Bnch", 1);
    out.SaveObject("Item", &root);
    out.Close();
}

#ifdef KERNEL_HAVE_MSGPACK
void Pack(Node const& node, msgpack::packer<msgpack::sbuffer>& packer)
{
    auto const key = [&](char const* name) {
        packer.pack_str(4);
        packer.pack_str_body(name, 4);
    };
    bool const hasColour = node.m_colour != 0xFF000000;
    bool const hasOpacity = node.m_opacity != 1.0f;
    bool const hasStyle = node.m_style.GetView() != "plain";
    bool const hasName = !node.m_name.IsEmpty();
    packer.pack_map(3u + hasColour + !node.m_isVisible + hasOpacity + hasStyle + hasName + !node.m_children.empty());
    key("Iden");
    packer.pack(node.m_id);
    key("PosX");
    packer.pack(node.m_x);
    key("PosY");
    packer.pack(node.m_y);
    if (hasColour) {
        key("Colo");
        packer.pack(node.m_colour);
    }
    if (!node.m_isVisible) {
        key("Visi");
        packer.pack(node.m_isVisible);
    }
    if (hasOpacity) {
        key("Opac");
        packer.pack(node.m_opacity);
    }
    if (hasStyle) {
        key("Styl");
        packer.pack(node.m_style.GetView());
    }
    if (hasName) {
        key("Name");
        packer.pack(node.m_name.GetView());
    }
    if (node.m_children.empty()) return;
    key("Chil");
    packer.pack_array(static_cast<u32>(node.m_children.size()));
    for (auto const& child : node.m_children) Pack(*child, packer);
}
#endif

} // namespace

int main()
{
    auto const tree = MakeTree();
    Bench::Table table("Object graph: 100,000 objects, 8 properties, half at default");
    constexpr double nsEach = 1e9 / c_objects;

    auto const stream = MakeCounted<BlockOutStream>();
    double const write = Bench::BestSeconds(c_rounds, [&] { WriteTree(*tree, *stream); }) * nsEach;
    double peer = 0;
#ifdef KERNEL_HAVE_MSGPACK
    msgpack::sbuffer buffer;
    peer = Bench::BestSeconds(c_rounds,
                              [&] {
                                  buffer.clear();
                                  msgpack::packer<msgpack::sbuffer> packer(buffer);
                                  Pack(*tree, packer);
                              }) *
           nsEach;
    table.Row("write", "msgpack maps", peer, "ns", 0);
    table.Row("size", "msgpack maps", static_cast<double>(buffer.size()) / c_objects, "B");
#endif
    table.Row("write", "property stream", write, "ns", peer, "<= 1.00 x msgpack");
    table.Row("size", "property stream", static_cast<double>(stream->m_size) / c_objects, "B");
    return 0;
}
