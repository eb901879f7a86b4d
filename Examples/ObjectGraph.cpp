// Saves and loads a graph of this program's own classes: defaults that take no room, a style that many shapes share, a
// reference back to the owner, an enumeration that changed between versions, and a class that the reader doesn't know.
//
//     ObjectGraph FOLDER
//
// Writes two files into the folder, reads them back and says what came of each. Exit status 0 if all is as it should
// be.

#include "libkernel/core/Hash.h"
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/Defaults.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/serialisation/Serialisable.h"
#include "libkernel/serialisation/SerialiseTo.h"
#include "libkernel/serialisation/SharedSerialisable.h"
#include "libkernel/streams/FileInStream.h"

#include <cstdio>
#include <filesystem>
#include <string>
#include <vector>

using namespace Kernel;

namespace {

constexpr IDTag c_fileKind("Drwg");
constexpr unsigned short c_fileVersion = 1;

int s_failures = 0;

void Check(bool holds, char const* claim)
{
    std::printf("  %s %s\n", holds ? "ok  " : "FAIL", claim);
    if (!holds) ++s_failures;
}

// A value of which one copy exists in memory, however many shapes use it. -----------------------------------------

class Style : public SharedSerialisable
{
public:
    static SharedClassProperties const s_classProperties;

    Style() = default;
    Style(u32 colourRGB, double lineWidth) : colour(colourRGB), width(lineWidth) {}

    void Save(OutSerialiser& out) const override
    {
        out.SaveType("Colr", colour);
        out.SaveType("Widt", width);
    }
    bool Load(InSerialiser const& in, FileStore&, unsigned short) override
    {
        return in.LoadType("Colr", colour) && in.LoadType("Widt", width);
    }
    void AccumulateHash(HashAccumulator& hash) const override
    {
        hash.AddToHash(&colour, sizeof(colour));
        hash.AddToHash(&width, sizeof(width));
    }
    bool CompareMembers(SharedSerialisable const& other, CompareContext const&) const override
    {
        auto const& style = static_cast<Style const&>(other);
        return colour == style.colour && width == style.width;
    }
    SharedClassProperties const* GetObjectClassProperties() const override { return &s_classProperties; }
    static SharedClassProperties const* GetTypeSharedClassProperties() { return &s_classProperties; }

    u32 colour = 0;
    double width = 0;
};

SharedClassProperties const Style::s_classProperties("Styl", &SharedClassProperties::CreateNew<Style>, 1, nullptr,
                                                     nullptr);
ClassPropertiesBase::Init const s_styleInit(&Style::s_classProperties);

Consolidated<Style> MakeStyle(u32 colour, double width)
{
    return Consolidate(MakeCounted<Style>(colour, width));
}

// An enumeration that changed: version 0 had two caps; today there are three, in another order. ---------------------

enum class Cap
{
    Flat = 0,
    Square = 1,
    Round = 2
};

/// The values of version 0, by what they are called today, and those of version 1.
EnumSerialiser const& GetCaps()
{
    static EnumSerialiser const s_caps = [] {
        EnumSerialiser caps;
        caps.RegisterEnumSet({{static_cast<int>(Cap::Flat)}, {static_cast<int>(Cap::Round)}});
        caps.RegisterEnumSet(
            {{static_cast<int>(Cap::Flat)}, {static_cast<int>(Cap::Square)}, {static_cast<int>(Cap::Round)}});
        return caps;
    }();
    return s_caps;
}

// A shape, and a group that owns shapes. ------------------------------------------------------------------------------

class Shape : public Serialisable
{
public:
    static ClassProperties const s_classProperties;

    void Save(OutSerialiser& out) const override
    {
        out.SaveType("Name", name);
        out.SaveType("Opac", opacity);
        out.SaveType("Visi", visible);
        out.SaveEnum("Cap ", GetCaps(), cap);
        out.SaveSharedObject("Styl", style);
        out.SaveObject("Ownr", NonCounted<Serialisable const>(owner), false);
    }
    bool Load(InSerialiser const& in, FileStore&, unsigned short) override
    {
        in.LoadType("Name", name);
        in.LoadType("Opac", opacity);
        in.LoadType("Visi", visible);
        in.LoadEnum("Cap ", GetCaps(), cap);
        in.LoadSharedObject("Styl", style);
        Counted<Serialisable> object;
        in.LoadObject("Ownr", object, false);
        owner = object.Get();
        return true;
    }
    ClassProperties const* GetObjectClassProperties() const override { return &s_classProperties; }

    String8 name;
    double opacity = 1.0;
    bool visible = true;
    Cap cap = Cap::Flat;
    Consolidated<Style> style;
    Serialisable* owner = nullptr; // Back to what owns the shape, so not counted.
};

Defaults::Item const* ShapeDefaults()
{
    static auto const s_items = Defaults::Make(Defaults::Value("Opac", 1.0), Defaults::Bool("Visi", true));
    return s_items.data();
}

ClassProperties const Shape::s_classProperties("Shap", &ClassProperties::CreateNew<Shape>, 2, ShapeDefaults(), nullptr);
ClassPropertiesBase::Init const s_shapeInit(&Shape::s_classProperties);

class Group : public Serialisable
{
public:
    static ClassProperties const s_classProperties;

    void Save(OutSerialiser& out) const override
    {
        out.SaveObjects("Kids", shapes);
        out.SaveObject("Extr", extra);
    }
    bool Load(InSerialiser const& in, FileStore&, unsigned short) override
    {
        in.LoadObject("Extr", extra);
        return in.LoadObjects("Kids", shapes);
    }
    ClassProperties const* GetObjectClassProperties() const override { return &s_classProperties; }

    std::vector<Counted<Shape>> shapes;
    Counted<Serialisable> extra;
};

ClassProperties const Group::s_classProperties("Grup", &ClassProperties::CreateNew<Group>, 1, nullptr, nullptr);
ClassPropertiesBase::Init const s_groupInit(&Group::s_classProperties);

/// What a plug-in of the writer added. It is never registered, so this program as a reader does not know it.
class Sparkle : public Serialisable
{
public:
    static ClassProperties const s_classProperties;
    void Save(OutSerialiser& out) const override { out.SaveType("Rays", 12u); }
    bool Load(InSerialiser const&, FileStore&, unsigned short) override { return false; }
    ClassProperties const* GetObjectClassProperties() const override { return &s_classProperties; }
};

ClassProperties const Sparkle::s_classProperties("Spkl", &ClassProperties::CreateNew<Sparkle>, 1, nullptr, nullptr);

// The shape as last year's program had it: two caps, no opacity. ---------------------------------------------------

class OldShape : public Serialisable
{
public:
    static ClassProperties const s_classProperties;
    void Save(OutSerialiser& out) const override
    {
        constexpr int round = 1; // As that program numbered it.
        EnumSerialiser caps;
        caps.RegisterEnumSet({{0}, {round}});
        out.SaveType("Name", String8("from last year"));
        out.SaveEnum("Cap ", caps, round);
    }
    bool Load(InSerialiser const&, FileStore&, unsigned short) override { return false; }
    ClassProperties const* GetObjectClassProperties() const override { return &s_classProperties; }
};

ClassProperties const OldShape::s_classProperties("Shap", &ClassProperties::CreateNew<OldShape>, 1, nullptr, nullptr);

bool SaveGraph(std::string const& path, Serialisable const& root)
{
    return SerialiseToFile(
        path.c_str(), c_fileKind, c_fileVersion,
        [&](OutSerialiser& out, IDTag tag) { out.SaveObject(tag, NonCounted<Serialisable const>(&root)); }, 0);
}

template <class T>
Counted<T> LoadGraph(std::string const& path)
{
    Counted<FileInStream> const stream = FileInStream::Open(path.c_str());
    if (!stream) return nullptr;
    Counted<InSerialiserFile> const in = InSerialiserFile::ParseSkipUnknownClasses(*stream);
    if (!in || in->GetFileIDTag() != c_fileKind) return nullptr;
    Counted<T> root;
    in->LoadObject("Item", root);
    return root;
}

void ShowDrawing(std::string const& path)
{
    auto const drawing = MakeCounted<Group>();
    for (int i = 0; i < 100; ++i) {
        auto const shape = MakeCounted<Shape>();
        shape->name = String8(("shape " + std::to_string(i)).c_str());
        shape->style = MakeStyle(i % 2 ? 0xFF8000 : 0x0080FF, 0.5);
        shape->cap = Cap::Square;
        shape->owner = drawing.Get();
        if (i == 7) shape->opacity = 0.25;
        drawing->shapes.push_back(shape);
    }
    drawing->extra = MakeCounted<Sparkle>();
    Check(SaveGraph(path, *drawing), "a drawing of 100 shapes is saved");
    std::printf("       %ju bytes\n", static_cast<std::uintmax_t>(std::filesystem::file_size(path)));

    Counted<Group> const loaded = LoadGraph<Group>(path);
    Check(loaded && loaded->shapes.size() == 100, "and loaded");
    if (!loaded || loaded->shapes.size() != 100) return;
    Shape const& seventh = *loaded->shapes[7];
    Shape const& ninth = *loaded->shapes[9];
    Check(seventh.name == "shape 7" && seventh.opacity == 0.25, "a value other than the default is kept");
    Check(ninth.opacity == 1.0 && ninth.visible, "defaults come back though they take no room in the file");
    Check(seventh.style == ninth.style && seventh.style == drawing->shapes[7]->style,
          "equal styles are one object, in this graph and in the one that was saved");
    Check(ninth.owner == loaded.Get(), "each shape refers back to its group");
    Check(!loaded->extra, "an object of an unknown class is left out, and the rest is there");
    Check(ninth.cap == Cap::Square, "today's enumeration is kept");
}

void ShowOldFile(std::string const& path)
{
    Check(SaveGraph(path, *MakeCounted<OldShape>()), "last year's program saves a shape");
    Counted<Shape> const loaded = LoadGraph<Shape>(path);
    Check(loaded && loaded->name == "from last year", "today's program loads it");
    Check(loaded && loaded->cap == Cap::Round, "and its cap is still round, though the numbers have changed");
    Check(loaded && loaded->opacity == 1.0, "what the old program did not know keeps its initial value");
}

} // namespace

int main(int argc, char** argv)
{
    if (argc != 2) {
        std::fprintf(stderr, "Usage: ObjectGraph FOLDER\n");
        return 2;
    }
    std::string const folder = argv[1];
    std::filesystem::create_directories(folder);
    std::printf("A drawing:\n");
    ShowDrawing(folder + "/drawing.graph");
    std::printf("A file of an older version:\n");
    ShowOldFile(folder + "/old.graph");
    std::printf("See them with: kerneltool stream dump %s/old.graph\n", folder.c_str());
    return s_failures == 0 ? 0 : 1;
}
