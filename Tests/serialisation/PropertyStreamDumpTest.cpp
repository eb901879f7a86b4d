#include "libkernel/serialisation/PropertyStreamDump.h"

#include "serialisation/ReaderClasses.h"
#include "support/Rows.h"

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
    PropertyBytes const b = PropertyBytes().Header().Put(
        "03 [MUID] 07000000 | 2B [Name] 04000000 'text' | 8A [Vals] 02000000 000000000000F03F 0000000000000440"
        "31 [Root] 01 00000000 00 [PTNd] 0200 00 02 00 | 00");
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
        for (char const* const json : {
                 R"({"tag":"Bool","type":41,"value":true})",
                 R"({"tag":"Enum","type":42,"value":{"code":2,"version":0}})",
                 R"({"tag":"Enms","type":42,"array":true,"value":{"codes":[2,0,1],"version":0}})",
                 "{\"tag\":\"Text\",\"type\":43,\"value\":\"na\xC3\xAFve\"}",
                 R"({"tag":"Txts","type":43,"array":true,"value":["ab",""]})",
                 R"({"tag":"Shps","type":46,"array":true,"value":["z"]})",
                 R"({"tag":"Cust","type":44,"value":"010203"})",
                 R"({"tag":"Csts","type":44,"array":true,"value":["010203","040506"]})",
                 R"({"tag":"Data","type":45,"value":"0908070605"})",
                 R"({"tag":"Algn","type":119,"value":"010203"})",
                 R"({"tag":"Frag","type":118,"value":"04030201"})",
                 R"({"tag":"Flag","type":117,"value":{"version":0,"bits":"118"}})",
                 R"({"tag":"Clas","type":50,"class":"InRg","version":1,)"
                 R"("properties":[{"tag":"Frst","type":3,"value":5}]})",
                 R"({"tag":"ClsN","type":50,"value":null})",
                 R"({"tag":"Clss","type":50,"array":true,"value":[{"class":"InRg","version":1,)"
                 R"("properties":[{"tag":"Frst","type":3,"value":6}]},null,)"
                 R"({"class":"InRg","version":1,"properties":[]}]})",
                 R"({"tag":"DlyN","type":51,"value":null})",
                 R"({"tag":"NulO","type":49,"value":null})",
                 R"({"tag":"NulA","type":49,"array":true,"value":[null,null,null,null]})",
                 R"({"tag":"Shrs","type":49,"array":true,"value":[{"ref":4294967295},{"ref":1}]})",
                 R"({"tag":"Shar","type":49,"object":4294967295,"classes":[{"uid":"RdSh"}],"properties":[)"
                 R"({"tag":"Numb","type":3,"value":6},{"tag":"Next","type":49,"ref":1}]})",
             })
            EXPECT_EQ(items.at(Json::parse(json)["tag"]).dump(), json);
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
    std::map<std::string, Json> const items = ByTag(Dump(PropertyBytes().Header().Put(
        "34 [Zero] 00000000 | 2F [Code] 42FFE941 | 2B [Text] 03000000 'a' FFC3 | 01 01000080 01 | 09 [NoNu] 0000C07F"
        "33 [Path] [Type] 03000000 'a/b' | 00")));
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
    for (auto const& [bytes, result, offset, path, reason] : Rows<char const*, Result, u64, char const*, char const*>{
             {"'PK plain archive'", Result::NotAStream, 0, "",
              "the first four bytes are not those of a property stream"},
             {"00FF4B53 0300 [Test] 0300", Result::Newer, 4, "", "format version 3, later than 2"},
             {"00FF4B53 0100 [Test] 0300 | 03 [Good] 01000000 | 78 [Newr]", Result::Newer, 21, "",
              "unknown property type 120"},
             {"00FF4B53 0100 [Test] 0300 | 32 [Outr] 01 [InRg] 0100 | 04 [Innr] 01000000", Result::Damaged, 33,
              "Outr/Innr", "the stream ends inside a value"},
             {"00FF4B53 0100 [Test] 0300 | 2D [Data] 64000000 01", Result::Damaged, 17, "Data",
              "a value of 100 bytes passes the end of the stream"},
             {"00FF4B53 0100 [Test] 0300 | 31 [Refr] 02 05000000 00", Result::Damaged, 17, "Refr",
              "reference to object 5, which has not been seen"}})
    {
        Counted<InStream> const in = Deliver(PropertyBytes().Put(bytes).bytes, Delivery::Memory);
        Json json = "untouched";
        PropertyStreamReport const report = DumpPropertyStream(*in, json);
        EXPECT_EQ(report.result, result) << reason;
        EXPECT_STREQ(report.reason.GetData(), reason);
        EXPECT_EQ(report.offset, offset) << reason;
        EXPECT_STREQ(report.path.GetData(), path);
        EXPECT_EQ(json, "untouched");
    }
}

} // namespace
} // namespace Kernel::Test
