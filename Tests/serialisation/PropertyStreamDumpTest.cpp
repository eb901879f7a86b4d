#include "libkernel/serialisation/PropertyStreamDump.h"

#include "serialisation/ReaderClasses.h"

#include <gtest/gtest.h>
#include <map>
#include <nlohmann/json.hpp>

namespace Kernel::Test {
namespace {

using Json = nlohmann::ordered_json;

Json Dump(PropertyBytes const& b, Delivery delivery = Delivery::Memory)
{
    Counted<InStream> const in = Deliver(b.bytes, delivery);
    Json json = "untouched";
    PropertyStreamReport const report = DumpPropertyStream(*in, json);
    EXPECT_TRUE(report.IsGood()) << report.reason.GetData();
    EXPECT_EQ(report.offset, b.bytes.size());
    return json;
}

std::map<std::string, Json> ByTag(Json const& json)
{
    std::map<std::string, Json> items;
    for (Json const& item : json["properties"]) items[item["tag"].get<std::string>()] = item;
    return items;
}

TEST(PropertyStreamDumpTest, HeaderAndItemsStandInTheirOrder)
{
    PropertyBytes b;
    b.Header().U32Item("MUID", 7).TextItem("Name", "text").Item(0x8A, "Vals").U32(2).F64(1).F64(2.5);
    b.Item(0x31, "Root").Object(0).RootClass("PTNd", 2).End().End();
    EXPECT_EQ(Dump(b).dump(),
              R"({"fileTag":"Test","formatVersion":2,"fileVersion":3,"buildIndex":24,)"
              R"("properties":[{"tag":"MUID","type":3,"value":7},{"tag":"Name","type":43,"value":"text"},)"
              R"({"tag":"Vals","type":10,"array":true,"value":[1.0,2.5]},)"
              R"({"tag":"Root","type":49,"object":0,"classes":[{"uid":"PTNd","version":2,"defaults":[]}],)"
              R"("properties":[]}]})");
}

TEST(PropertyStreamDumpTest, EveryFormShowsAsItsKind)
{
    for (Delivery delivery : c_deliveries) {
        std::map<std::string, Json> const items = ByTag(Dump(EveryItemForm(), delivery));
        struct
        {
            char const* tag;
            char const* json;
        } const cases[] = {
            {"Bool", R"({"tag":"Bool","type":41,"value":true})"},
            {"Enum", R"({"tag":"Enum","type":42,"value":{"code":2,"version":0}})"},
            {"Enms", R"({"tag":"Enms","type":42,"array":true,"value":{"codes":[2,0,1],"version":0}})"},
            {"Text", "{\"tag\":\"Text\",\"type\":43,\"value\":\"na\xC3\xAFve\"}"},
            {"Txts", R"({"tag":"Txts","type":43,"array":true,"value":["ab",""]})"},
            {"Shps", R"({"tag":"Shps","type":46,"array":true,"value":["z"]})"},
            {"Cust", R"({"tag":"Cust","type":44,"value":"010203"})"},
            {"Csts", R"({"tag":"Csts","type":44,"array":true,"value":["010203","040506"]})"},
            {"Data", R"({"tag":"Data","type":45,"value":"0908070605"})"},
            {"Algn", R"({"tag":"Algn","type":119,"value":"010203"})"},
            {"Frag", R"({"tag":"Frag","type":118,"value":"04030201"})"},
            {"Flag", R"({"tag":"Flag","type":117,"value":{"version":0,"bits":"118"}})"},
            {"Clas", R"({"tag":"Clas","type":50,"class":"InRg","version":1,)"
                     R"("properties":[{"tag":"Frst","type":3,"value":5}]})"},
            {"ClsN", R"({"tag":"ClsN","type":50,"value":null})"},
            {"Clss", R"({"tag":"Clss","type":50,"array":true,"value":[{"class":"InRg","version":1,)"
                     R"("properties":[{"tag":"Frst","type":3,"value":6}]},null,)"
                     R"({"class":"InRg","version":1,"properties":[]}]})"},
            {"DlyN", R"({"tag":"DlyN","type":51,"value":null})"},
            {"NulO", R"({"tag":"NulO","type":49,"value":null})"},
            {"NulA", R"({"tag":"NulA","type":49,"array":true,"value":[null,null,null,null]})"},
            {"Shrs", R"({"tag":"Shrs","type":49,"array":true,"value":[{"ref":4294967295},{"ref":1}]})"},
            {"Shar", R"({"tag":"Shar","type":49,"object":4294967295,"classes":[{"uid":"RdSh"}],"properties":[)"
                     R"({"tag":"Numb","type":3,"value":6},{"tag":"Next","type":49,"ref":1}]})"},
        };
        for (auto const& c : cases) EXPECT_EQ(items.at(c.tag).dump(), c.json);
        Json const& stream = items.at("Strm");
        EXPECT_EQ(stream["value"]["version"], 7);
        EXPECT_EQ(stream["value"]["items"].size(), 13u);
        EXPECT_EQ(stream["value"]["items"][0].dump(), R"({"type":3,"value":42})");
        Json const& classes = items.at("Root")["classes"];
        ASSERT_EQ(classes.size(), 2u);
        EXPECT_EQ(classes[0]["defaults"].size(), 10u);
        EXPECT_EQ(classes[1].dump(), R"({"uid":"RdNo","version":2,"defaults":[]})");
    }
}

TEST(PropertyStreamDumpTest, CodesAndTextsAreAlwaysValidJson)
{
    PropertyBytes b;
    b.Header().Item(52, "Zero").U32(0).Item(47, "Code").U32(0x41E9FF42).TextItem("Text", "a\xFF\xC3");
    b.U8(1).U32(0x80000001).U8(1).Item(9, "NoNu").U32(0x7FC00000);
    b.Item(0x33, "Path").Code("Type").U32(3).Text("a/b").End();
    std::map<std::string, Json> const items = ByTag(Dump(b));
    EXPECT_EQ(items.at("Zero")["value"], "<>");
    EXPECT_EQ(items.at("Code")["value"], "A\xC3\xA9\xC3\xBF"
                                         "B");
    EXPECT_EQ(items.at("Text")["value"], "a\xEF\xBF\xBD\xEF\xBF\xBD");
    EXPECT_EQ(items.at("Path").dump(), R"({"tag":"Path","type":51,"class":"Type","path":"a/b"})");
    EXPECT_EQ(items.at("NoNu").dump(), R"({"tag":"NoNu","type":9,"value":null})");
    EXPECT_EQ(Dump(PropertyBytes().Header(1).End())["buildIndex"], 0);
    EXPECT_TRUE(items.contains(std::string("\xC2\x80\0\0\1", 5)));
}

TEST(PropertyStreamDumpTest, ReportNamesTheFirstWrongByte)
{
    using Result = PropertyStreamReport::Result;
    PropertyBytes other;
    other.Text("PK plain archive");
    PropertyBytes newer;
    newer.Header(3);
    PropertyBytes type;
    type.Header().U32Item("Good", 1).Item(0x78, "Newr");
    PropertyBytes cut;
    cut.Header().Item(0x32, "Outr").U8(1).Code("InRg").U16(1).Item(4, "Innr").U32(1);
    PropertyBytes length;
    length.Header().Item(0x2D, "Data").U32(100).U8(1);
    PropertyBytes reference;
    reference.Header().Item(0x31, "Refr").BackReference(5).End();
    struct
    {
        PropertyBytes const& bytes;
        Result result;
        u64 offset;
        char const* path;
        char const* reason;
    } const cases[] = {
        {other, Result::NotAStream, 0, "", "the first four bytes are not those of a property stream"},
        {newer, Result::Newer, 4, "", "format version 3, later than 2"},
        {type, Result::Newer, 25, "", "unknown property type 120"},
        {cut, Result::Damaged, 37, "Outr/Innr", "the stream ends inside a value"},
        {length, Result::Damaged, 21, "Data", "a value of 100 bytes passes the end of the stream"},
        {reference, Result::Damaged, 21, "Refr", "reference to object 5, which has not been seen"},
    };
    for (auto const& c : cases) {
        Counted<InStream> const in = Deliver(c.bytes.bytes, Delivery::Memory);
        Json json = "untouched";
        PropertyStreamReport const report = DumpPropertyStream(*in, json);
        EXPECT_EQ(report.result, c.result) << c.reason;
        EXPECT_STREQ(report.reason.GetData(), c.reason);
        EXPECT_EQ(report.offset, c.offset) << c.reason;
        EXPECT_STREQ(report.path.GetData(), c.path);
        EXPECT_EQ(json, "untouched");
    }
}

} // namespace
} // namespace Kernel::Test
