#include "PropertyChecks.h"

#include <functional>
#include <memory>
#include <nlohmann/json.hpp>

namespace {

using namespace Kernel;
using Fuzz::Require;

constexpr EnumSerialiser::EnumEntry c_oldEnums[] = {{7}, {3}, {-1}};
constexpr EnumSerialiser::EnumEntry c_newEnums[] = {{3}, {7, 1}, {2000000000}, {0}, {-1}};
constexpr FlagSerialiser::FlagIndex c_oldFlags[] = {{0}, {5}, {2}};
constexpr FlagSerialiser::FlagIndex c_newFlags[] = {{63}, {0}, {5, 1}, {31}, {2}, {40}};
constexpr int c_knownEnums[] = {3, 7, 2000000000, 0, -1};
constexpr u64 c_knownFlags[] = {1, 32, 4, u64(1) << 63, u64(1) << 31, u64(1) << 40, 0, 37};

EnumSerialiser MakeEnums()
{
    EnumSerialiser enums;
    enums.RegisterEnumSet(c_oldEnums);
    enums.RegisterEnumSet(c_newEnums);
    return enums;
}

FlagSerialiser MakeFlags()
{
    FlagSerialiser flags;
    flags.RegisterFlagIndices(c_oldFlags);
    flags.RegisterFlagIndices(c_newFlags);
    return flags;
}

// What the bytes of an input ask for, saved under tags 1, 2, 3, ..., and for each what must be read there.
class Script
{
public:
    explicit Script(Fuzz::Input& input) : m_input(input)
    {
        for (u32 n = 1 + m_input.TakeBelow(8); n != 0; --n) {
            m_nodes.push_back(Make());
            m_shared.push_back(MakeShared());
        }
        // Any node may hold any other, itself too.
        for (auto const& node : m_nodes) {
            node->child = AnyNode();
            node->reference = AnyNode();
            for (u32 n = m_input.TakeBelow(4); n != 0; --n) node->kids.push_back(AnyNode());
            node->shared = AnyShared();
        }
    }

    using Check = std::function<void(InSerialiser const&)>;
    using Checks = std::vector<Check>;

    Checks SaveList(OutSerialiser& out, u32 depth)
    {
        Checks checks;
        u32 tag = 0;
        for (u32 n = m_input.TakeBelow(24); n != 0 && m_input.GetLeft() != 0; --n) {
            IDTag const next(m_input.TakeBool() ? ++tag : tag += m_input.Take() + 1u);
            checks.push_back(SaveOne(out, next, depth));
        }
        checks.push_back([count = checks.size()](InSerialiser const& in) {
            Require(in.GetTags().size() == count, "as many properties come back as were saved");
        });
        return checks;
    }

private:
    template <class T>
    T Number()
    {
        u64 bits = 0;
        for (size_t i = 0; i < sizeof(T); ++i) bits = bits << 8 | m_input.Take();
        T value{};
        std::memcpy(&value, &bits, sizeof(T));
        if (value != value) value = T(1); // One that equals nothing could not be compared.
        return value;
    }
    std::string Text()
    {
        std::string text;
        for (u32 n = m_input.TakeBelow(20); n != 0; --n) text += static_cast<char>(m_input.Take() & 127);
        u32 const repetitions = m_input.TakeBelow(16) == 0 ? 3000 : 1;
        std::string all;
        for (u32 i = 0; i < repetitions; ++i) all += text;
        return all;
    }
    String8 String() { return String8(Text().c_str()); }
    Counted<Test::ReaderNode> Make()
    {
        bool const isDerived = m_input.TakeBool();
        Counted<Test::ReaderNode> const node(isDerived ? new Test::ReaderDerived : new Test::ReaderNode);
        node->number = Number<u16>();
        node->name = String();
        return node;
    }
    Consolidated<SharedSerialisable> MakeShared()
    {
        Counted<Test::ReaderShared> const shared(new Test::ReaderShared);
        shared->number = m_input.Take();
        shared->next = AnyShared();
        return Consolidated<SharedSerialisable>::Trust(shared);
    }
    Counted<Test::ReaderNode> AnyNode()
    {
        u32 const n = m_input.TakeBelow(static_cast<u32>(m_nodes.size()) + 1);
        return n < m_nodes.size() ? m_nodes[n] : nullptr;
    }
    Consolidated<SharedSerialisable> AnyShared()
    {
        u32 const n = m_input.TakeBelow(static_cast<u32>(m_shared.size()) + 1);
        return n < m_shared.size() ? m_shared[n] : Consolidated<SharedSerialisable>();
    }

    template <class T>
    static Check Equal(IDTag tag, T value)
    {
        return [=](InSerialiser const& in) {
            T found{};
            Require(in.LoadType(tag, found) && found == value, "a value comes back");
        };
    }
    template <class T>
    Check SaveNumbers(OutSerialiser& out, IDTag tag)
    {
        if (m_input.TakeBool()) {
            T const value = Number<T>();
            out.SaveType(tag, value);
            return Equal(tag, value);
        }
        std::vector<T> values;
        for (u32 n = m_input.TakeBelow(9); n != 0; --n) values.push_back(Number<T>());
        out.SaveTypes(tag, values);
        return [=](InSerialiser const& in) {
            std::vector<T> found{T()};
            Require(in.LoadTypes(tag, found) && found == values, "an array comes back");
        };
    }

    Check SaveOne(OutSerialiser& out, IDTag tag, u32 depth)
    {
        switch (m_input.TakeBelow(24)) {
        case 0: return SaveNumbers<u8>(out, tag);
        case 1: return SaveNumbers<i16>(out, tag);
        case 2: return SaveNumbers<u32>(out, tag);
        case 3: return SaveNumbers<i64>(out, tag);
        case 4: return SaveNumbers<float>(out, tag);
        case 5: return SaveNumbers<double>(out, tag);
        case 6: {
            std::vector<bool> flags;
            for (u32 n = m_input.TakeBelow(20); n != 0; --n) flags.push_back(m_input.TakeBool());
            out.SaveTypes(tag, flags);
            return [=](InSerialiser const& in) {
                std::vector<bool> found{true};
                Require(in.LoadTypes(tag, found) && found == flags, "bools come back");
            };
        }
        case 7: {
            bool const flag = m_input.TakeBool();
            out.SaveType(tag, flag);
            return Equal(tag, flag);
        }
        case 8: {
            String8 const text = String();
            out.SaveType(tag, text);
            return Equal(tag, text);
        }
        case 9: {
            std::string const plain = Text();
            String16 const text(std::u16string(plain.begin(), plain.end()).c_str());
            out.SaveType(tag, text);
            return Equal(tag, text);
        }
        case 10: {
            std::vector<String8> texts;
            for (u32 n = m_input.TakeBelow(5); n != 0; --n) texts.push_back(String());
            out.SaveTypes(tag, texts);
            return [=](InSerialiser const& in) {
                std::vector<String8> found{String8("x")};
                Require(in.LoadTypes(tag, found) && found == texts, "texts come back");
            };
        }
        case 11: {
            nlohmann::json const json = {{Text(), Number<i32>()}, {"list", {Text(), nullptr, true}}};
            out.SaveType(tag, json);
            return Equal(tag, json);
        }
        case 12: {
            std::string const bytes = Text();
            u64 const alignment = m_input.TakeBelow(4) == 0 ? 0 : u64(1) << m_input.TakeBelow(4);
            if (alignment)
                out.SaveAlignedRawData(tag, bytes.data(), bytes.size(), alignment);
            else
                out.SaveRawData(tag, bytes.data(), bytes.size());
            return [=](InSerialiser const& in) {
                RawDataBlock found;
                Require(in.LoadRawData(tag, found) && found.GetSize() == bytes.size() &&
                            std::equal(bytes.begin(), bytes.end(), static_cast<char const*>(found.GetData())),
                        "raw data comes back");
            };
        }
        case 13: {
            std::string const bytes = Text();
            auto const data = MakeCounted<FragmentedRawData>(1 + m_input.Take());
            Require(data->SetData(0, bytes.data(), bytes.size(), false), "data can be set");
            out.SaveFragmentedRawData(tag, *data);
            return [=](InSerialiser const& in) {
                Counted<FragmentedRawData> found;
                Require(in.LoadFragmentedRawData(tag, found) && found->GetSize() == bytes.size(),
                        "its size comes back");
                std::string read(bytes.size(), 0);
                found->GetData(0, read.data(), read.size());
                Require(read == bytes, "fragmented data comes back");
            };
        }
        case 14: {
            static EnumSerialiser const s_enums = MakeEnums();
            std::vector<int> values;
            for (u32 n = m_input.TakeBelow(6); n != 0; --n)
                values.push_back(c_knownEnums[m_input.TakeBelow(std::size(c_knownEnums))]);
            std::vector<unsigned short> codes;
            unsigned short version = 0;
            if (!s_enums.EncodeToSerial(values.data(), values.size(), codes, version)) values.clear();
            out.SaveEnumsI(tag, s_enums, values.data(), values.size());
            return [=](InSerialiser const& in) {
                std::vector<int> found{1};
                Require(in.LoadEnumI(tag, s_enums, found) && found == values, "enums come back");
            };
        }
        case 15: {
            static FlagSerialiser const s_flags = MakeFlags();
            u64 const flags = c_knownFlags[m_input.TakeBelow(std::size(c_knownFlags))];
            out.SaveFlagSetI(tag, s_flags, flags, 8);
            return [=](InSerialiser const& in) {
                u64 found = 0;
                Require(in.LoadFlagSetI(tag, s_flags, found, 8) && found == flags, "flags come back");
            };
        }
        case 16: {
            std::string bytes = Text();
            bytes.resize(std::max<size_t>(1, bytes.size() % 65));
            out.SaveRawStructI(tag, bytes.data(), bytes.size());
            return [=](InSerialiser const& in) {
                char found[64];
                Require(in.LoadRawStructI(tag, found, bytes.size()) && bytes == std::string(found, bytes.size()),
                        "a raw struct comes back");
            };
        }
        case 17: {
            std::string const bytes = Text();
            u64 const unit = 1 + m_input.TakeBelow(12);
            u64 const whole = bytes.size() / unit;
            out.SavePropertyStructArrayI(tag, bytes.data(), unit, whole);
            return [=](InSerialiser const& in) {
                u64 count = 0;
                void const* const found = in.LoadTypeCustomArrayI(tag, unit, count);
                Require(found && count == whole && std::memcmp(found, bytes.data(), whole * unit) == 0,
                        "structs come back");
            };
        }
        case 18: return SaveStream(out, tag);
        case 19: {
            if (depth > 20) return SaveNumbers<u8>(out, tag);
            ClassUID const uid(Number<u32>() | 1);
            u16 const version = Number<u16>();
            out.StartClassTestI(tag);
            out.StartClassBeginI(tag, uid, version);
            Checks inner;
            {
                OutSerialiser child(out, nullptr);
                inner = SaveList(child, depth + 1);
                child.Close();
            }
            out.EndPropClassI();
            return [=](InSerialiser const& in) {
                ClassUID foundUID;
                unsigned short foundVersion = 0;
                auto const list = in.LoadClassI(tag, foundUID, foundVersion);
                Require(list && foundUID == uid && foundVersion == version, "an inline class comes back");
                for (Check const& check : inner) check(*list);
            };
        }
        case 20: {
            out.SaveSharedObject(tag, AnyShared());
            return [](InSerialiser const&) {};
        }
        case 21: {
            std::vector<Counted<Test::ReaderNode>> nodes;
            for (u32 n = m_input.TakeBelow(5); n != 0; --n) nodes.push_back(AnyNode());
            out.SaveObjects(tag, nodes);
            return [count = nodes.size(), tag](InSerialiser const& in) {
                std::vector<Counted<Test::ReaderNode>> found;
                Require(in.LoadObjects(tag, found) && found.size() == count, "objects come back");
            };
        }
        default: {
            Counted<Test::ReaderNode> const node = AnyNode();
            out.SaveObject(tag, node);
            // The whole graph is compared by the copy that is made of what was read.
            return [=, number = node ? node->number : 0, name = node ? node->name : String8()](InSerialiser const& in) {
                Counted<Test::ReaderNode> found;
                Require(in.LoadObject(tag, found) && static_cast<bool>(found) == static_cast<bool>(node),
                        "an object comes back");
                if (!found) return;
                Require(found->number == number && found->name == name, "with its members");
                Require(found->kids.size() == node->kids.size() &&
                            static_cast<bool>(found->child) == static_cast<bool>(node->child) &&
                            (!found->child || found->child->name == node->child->name) &&
                            (found->child == found) == (node->child == node),
                        "and with what they hold");
            };
        }
        }
    }

    Check SaveStream(OutSerialiser& out, IDTag tag)
    {
        u16 const version = Number<u16>();
        using StreamCheck = std::function<bool(InSerialiserPropertyDataStream&)>;
        std::vector<StreamCheck> checks;
        OutSerialiserPropertyDataStream stream(out, tag, version);
        for (u32 n = m_input.TakeBelow(8); n != 0; --n) {
            switch (m_input.TakeBelow(4)) {
            case 0: {
                auto const value = Number<double>();
                stream.SaveValue(value);
                checks.push_back([=](auto& in) {
                    double found = 0;
                    return in.LoadValue(found) && found == value;
                });
                break;
            }
            case 1: {
                String8 const text = String();
                stream.SaveValue(text);
                checks.push_back([=](auto& in) {
                    String8 found;
                    return in.LoadValue(found) && found == text;
                });
                break;
            }
            case 2: {
                std::string const bytes = Text();
                stream.SaveValueRaw(bytes.data(), bytes.size());
                checks.push_back([=](auto& in) {
                    RawDataBlock found;
                    return in.LoadValueRaw(found) && found.GetSize() == bytes.size() &&
                           std::equal(bytes.begin(), bytes.end(), static_cast<char const*>(found.GetData()));
                });
                break;
            }
            default: {
                std::vector<u16> values;
                for (u32 i = m_input.TakeBelow(9); i != 0; --i) values.push_back(Number<u16>());
                stream.SaveValues(values);
                checks.push_back([=](auto& in) {
                    std::vector<u16> found{1};
                    return in.LoadValues(found) && found == values;
                });
            }
            }
        }
        stream.Close();
        return [=](InSerialiser const& in) {
            InSerialiserPropertyDataStream found;
            Require(in.LoadDataStream(tag, found) && found.GetVersion() == version, "a data stream comes back");
            for (StreamCheck const& check : checks) Require(check(found), "with each value");
            Require(found.GetCurrentPropType() == PropType::EndOfList, "and no more");
        };
    }

    Fuzz::Input& m_input;
    std::vector<Counted<Test::ReaderNode>> m_nodes;
    std::vector<Consolidated<SharedSerialisable>> m_shared;
};

} // namespace

// Bytes drive a graph of objects and the values beside it; what is saved is read and compared, and saved once more.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    Fuzz::CircleBreaker const breaker;
    Fuzz::Input input(data, size);
    Script script(input);
    Counted<MemoryInOutStream> const stream(new MemoryInOutStream);
    Script::Checks checks;
    try {
        OutSerialiserFile out(*stream, IDTag("Fuzz"), 1);
        checks = script.SaveList(out, 0);
        out.Close();
    } catch (OutSerialiser::SaveException const& exception) {
        throw std::logic_error("a graph can be saved, code " + std::to_string(exception.GetCode()));
    }
    u8 const* const begin = static_cast<u8 const*>(stream->GetBuffer());
    Fuzz::Bytes const bytes(begin, begin + stream->GetSize());
    Fuzz::ParseResult const read =
        Fuzz::ParseProperties(bytes, input.TakeBool(), Test::c_deliveries[input.TakeBelow(4)]);
    Require(read.outcome == Fuzz::ParseOutcome::Parsed && read.end == bytes.size(), "what was saved can be read");
    for (Script::Check const& check : checks) check(*read.file);
    Require(Fuzz::CheckSavedAgain(*read.file), "and saved again");
    return 0;
}
