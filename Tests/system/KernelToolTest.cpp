#include "support/KernelTool.h"

#include "support/ArchiveFixture.h"
#include "support/TempFolder.h"

#include <algorithm>
#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

// The contract of the command line: exit statuses, JSON keys and what a call leaves behind.

namespace KernelTest {
namespace {

namespace fs = std::filesystem;
using Json = nlohmann::ordered_json;
using namespace std::string_literals;
using testing::HasSubstr;

std::vector<std::string> KeysOf(Json const& value)
{
    std::vector<std::string> keys;
    for (auto const& [key, ignored] : value.items()) keys.push_back(key);
    return keys;
}

class KernelToolTest : public testing::Test
{
protected:
    void SetUp() override
    {
        fs::create_directories(m_folder / "in/sub");
        WriteWhole(m_folder / "in/a.txt", "alpha");
        WriteWhole(m_folder / "in/sub/b.txt", std::string(5000, 'b'));
        WriteWhole(m_folder / "in/empty", "");
        Do({"archive", "create", m_doc});
        Do({"archive", "put", m_doc, "--tree", m_folder / "in"});
    }
    ToolResult Run(std::vector<std::string> const& words, std::string const& input = {})
    {
        return RunKernelTool(words, m_folder.GetPath(), input);
    }
    /// Runs what must succeed, and gives what it printed.
    std::string Do(std::vector<std::string> const& words, std::string const& input = {})
    {
        ToolResult const result = Run(words, input);
        EXPECT_EQ(result.status, 0) << result.err;
        return result.out;
    }
    void ExpectFailure(std::vector<std::string> const& words, int status, std::string const& text)
    {
        ToolResult const result = Run(words);
        SCOPED_TRACE(text + " | " + result.err);
        EXPECT_EQ(result.status, status);
        EXPECT_THAT(result.err, testing::StartsWith("kerneltool: "));
        EXPECT_THAT(result.err, HasSubstr(text));
    }
    Json RunJson(std::vector<std::string> words, int status = 0)
    {
        words.push_back("--json");
        ToolResult const result = Run(words);
        EXPECT_EQ(result.status, status) << result.err;
        return Json::parse(result.out, nullptr, false);
    }

    TestSupport::TempFolder m_folder;
    std::string const m_doc = m_folder / "doc";
};

TEST_F(KernelToolTest, JsonHasTheAgreedKeysInOrder)
{
    Do({"archive", "rm", m_doc, "empty"});
    std::vector<std::string> const file = {
        "path",          "fileVersion", "flags",       "firstFAT",     "fileEnd",       "totalBytes", "deadBytes",
        "saveTimeStamp", "saveCount",   "nextFreeUID", "writeCounter", "thumbnailsPos", "link",       "referencePath"};
    Json const info = RunJson({"archive", "info", m_doc});
    EXPECT_EQ(KeysOf(info), (std::vector<std::string>{"archiveUID", "readOnly", "revisions", "items", "nextFreeUID",
                                                      "master", "scratch"}));
    EXPECT_EQ(KeysOf(info["master"]), file);
    EXPECT_EQ(info["archiveUID"], "Docu");
    EXPECT_EQ(info["revisions"], 2);
    EXPECT_EQ(info["items"], 2);
    EXPECT_EQ(info["nextFreeUID"], 4);
    EXPECT_EQ(info["master"]["fileEnd"], fs::file_size(m_doc));
    EXPECT_TRUE(info["scratch"].is_null());

    Json const list = RunJson({"archive", "ls", m_doc});
    ASSERT_EQ(list.size(), 2u);
    EXPECT_EQ(KeysOf(list[0]),
              (std::vector<std::string>{"path", "uid", "size", "storedSize", "method", "predictor", "striping", "crc",
                                        "storedCrc", "buildIndex", "revision", "in"}));
    EXPECT_EQ(list[0]["path"], "a.txt");
    EXPECT_EQ(list[0]["crc"], "d0e0396a"); // By zlib's crc32.
    EXPECT_EQ(list[1]["method"], "zstd");

    Json const history = RunJson({"archive", "history", m_doc});
    ASSERT_EQ(history.size(), 2u);
    EXPECT_EQ(KeysOf(history[0]), (std::vector<std::string>{"index", "in", "timeStamp", "tag", "nextFAT", "fileEnd",
                                                            "totalBytes", "deadBytes", "userDataSize", "entries"}));
    EXPECT_EQ(KeysOf(history[0]["entries"][0]),
              (std::vector<std::string>{"path", "uid", "kind", "filePos", "size", "storedSize"}));
    EXPECT_EQ(history[0]["nextFAT"], 0);
    EXPECT_EQ(history[0]["fileEnd"], info["master"]["firstFAT"]); // The second revision is a table and nothing else.
    EXPECT_EQ(history[1]["fileEnd"], info["master"]["fileEnd"]);
    EXPECT_EQ(history[1]["entries"], Json::parse(R"([{"path": "empty", "uid": 2, "kind": "deleted"}])"));

    EXPECT_EQ(RunJson({"archive", "verify", m_doc}), Json::parse(R"({"checked": 3, "damaged": []})"));
    EXPECT_EQ(RunJson({"archive", "test", m_doc}), Json::parse(R"({"result": 0, "name": "OpenOk"})"));

    Do({"archive", "create", m_folder / "ref", "--uid", "Draw", "--reference", "/else/where"});
    Json const other = RunJson({"archive", "info", m_folder / "ref"});
    EXPECT_EQ(other["archiveUID"], "Draw");
    EXPECT_EQ(other["master"]["referencePath"], "/else/where");
    EXPECT_EQ(other["master"]["flags"], 2);

    // A revision of an unknown kind is shown by its number.
    std::string bytes = ReadWhole(m_doc);
    constexpr u64 c_tagOffset = 58;
    bytes[info["master"]["firstFAT"].get<u64>() + c_tagOffset] = 9;
    WriteWhole(m_doc, bytes);
    EXPECT_THAT(Run({"archive", "history", m_doc}).out, HasSubstr("master, tag 9, file end"));
}

TEST_F(KernelToolTest, PutLeavesUnchangedItemsAloneExceptInARewriteSession)
{
    std::string const before = ReadWhole(m_doc);
    Json const report = RunJson({"archive", "put", m_doc, "--tree", m_folder / "in"});
    EXPECT_EQ(report["unchanged"].size(), 3u);
    EXPECT_EQ(ReadWhole(m_doc), before);

    Do({"archive", "put", m_doc, "a.txt=" + m_folder / "in/a.txt", "sub/b.txt=-"}, "new");
    EXPECT_EQ(RunJson({"archive", "history", m_doc})[1]["entries"].size(), 1u);
    Do({"archive", "put", m_doc, "a.txt=" + m_folder / "in/a.txt", "--session", "rewrite"});
    Json const last = RunJson({"archive", "history", m_doc})[2];
    ASSERT_EQ(last["entries"].size(), 1u);
    EXPECT_EQ(last["entries"][0]["kind"], "changed");
}

TEST_F(KernelToolTest, OptionsOfASaveReachTheFile)
{
    struct
    {
        char const* what;
        std::vector<std::string> options;
        char const* method;
        int predictor, striping, tag;
    } const cases[] = {
        {"stored", {"--level", "store"}, "direct", 0, 0, 0},
        {"smallest", {"--level", "max", "--session", "incremental"}, "zstd", 0, 0, 1},
        {"bytes", {"--predictor", "8", "--striped"}, "zstd", 1, 0, 0},
        {"words", {"--predictor=16", "--striped"}, "zstd", 2, 1, 0},
        {"ints", {"--predictor", "32", "--level", "min", "--session", "export"}, "zstd", 3, 0, 0},
        {"none", {"--user-data", m_doc}, "zstd", 0, 0, 0},
    };
    std::string numbers;
    for (int i = 0; i < 50000; ++i) numbers.append(reinterpret_cast<char const*>(&i), sizeof(i));
    WriteWhole(m_folder / "numbers", numbers);
    for (auto const& c : cases) {
        SCOPED_TRACE(c.what);
        std::vector<std::string> words = {"archive", "put", m_doc, c.what + ("=" + m_folder / "numbers"), "--verify"};
        words.insert(words.end(), c.options.begin(), c.options.end());
        Do(words);
        Json const list = RunJson({"archive", "ls", m_doc});
        Json const found = *std::find_if(list.begin(), list.end(), [&](auto& row) { return row["path"] == c.what; });
        EXPECT_EQ(found["method"], c.method);
        EXPECT_EQ(found["predictor"], c.predictor);
        EXPECT_EQ(found["striping"], c.striping);
        Json const revision = RunJson({"archive", "history", m_doc}).back();
        EXPECT_EQ(revision["tag"], c.tag);
        EXPECT_EQ(revision["userDataSize"] == 0, c.what != std::string("none"));
        EXPECT_EQ(Do({"archive", "cat", m_doc, c.what}), numbers);
    }
}

TEST_F(KernelToolTest, EarlierRevisionsCanBeReadBack)
{
    Do({"archive", "put", m_doc, "a.txt=-"}, "second");
    Do({"archive", "rm", m_doc, "a.txt"});
    EXPECT_EQ(Run({"archive", "cat", m_doc, "a.txt"}).status, 1);
    EXPECT_EQ(Do({"archive", "cat", m_doc, "a.txt", "--at", "1"}), "second");
    EXPECT_EQ(Do({"archive", "cat", m_doc, "a.txt", "--at", "2"}), "alpha");
    EXPECT_EQ(RunJson({"archive", "ls", m_doc, "--at", "3"}).size(), 0u);
    EXPECT_EQ(Run({"archive", "ls", m_doc, "--at", "4"}).status, 1);
}

TEST_F(KernelToolTest, ScratchFileOpensItsMasterAndRollsDown)
{
    std::string const scratch = m_folder / "doc.scratch";
    Do({"archive", "scratch", "doc", scratch});
    std::string const master = ReadWhole(m_doc);
    Do({"archive", "put", scratch, "a.txt=-", "--scratch"}, "from scratch");
    EXPECT_EQ(ReadWhole(m_doc), master);
    Json const info = RunJson({"archive", "info", scratch});
    EXPECT_EQ(info["scratch"]["link"]["path"], m_doc);
    EXPECT_EQ(info["scratch"]["link"]["saveCount"], info["master"]["saveCount"]);
    EXPECT_EQ(RunJson({"archive", "ls", scratch})[0]["in"], "scratch");
    EXPECT_EQ(Do({"archive", "cat", m_doc, "a.txt"}), "alpha");

    Do({"archive", "put", scratch, "new=-"}, "n");
    EXPECT_EQ(Do({"archive", "cat", m_doc, "a.txt"}), "from scratch");
    EXPECT_EQ(RunJson({"archive", "verify", scratch})["damaged"].size(), 0u);

    ExpectFailure({"archive", "scratch", m_doc, scratch}, 1, "Exists (3)");
}

TEST_F(KernelToolTest, ThumbnailOutlivesLaterSaves)
{
    std::string const image = "\x89PNG not really";
    WriteWhole(m_folder / "image", image);
    std::string const item = Run({"archive", "cat", m_doc, "empty"}).out;
    Do({"archive", "thumbnail", m_doc, "--set", m_folder / "image"});
    Do({"archive", "put", m_doc, "new=-"}, "n");
    Do({"archive", "rm", m_doc, "new"});
    Do({"archive", "thumbnail", m_doc, "--get", m_folder / "got"});
    EXPECT_EQ(ReadWhole(m_folder / "got"), image);
    EXPECT_EQ(Do({"archive", "cat", m_doc, "empty"}), item);
    Do({"archive", "create", m_folder / "bare"});
    EXPECT_EQ(Run({"archive", "thumbnail", m_folder / "bare", "--get", m_folder / "none"}).status, 1);
}

TEST_F(KernelToolTest, TreeComesOutAsItWentInAndExtractStaysInsideItsTarget)
{
    std::string const secret = m_folder / "secret";
    WriteWhole(secret, "untouched");
    fs::create_directories(m_folder / "outside");
    fs::create_directories(m_folder / "out/real");
    fs::create_symlink(m_folder / "outside", m_folder / "out/folderlink");
    fs::create_symlink(secret, m_folder / "out/filelink");
    std::vector<std::string> const bad = {"../secret", secret,    "x/../../secret", "folderlink/inside",
                                          "filelink",  "real/..", "real",           "a.txt/below"};
    for (std::string const& item : bad)
        ASSERT_EQ(Run({"archive", "put", m_doc, item + "=-"}, "evil").status, 0) << item;

    fs::create_symlink("a.txt", m_folder / "in/link");
    Do({"archive", "put", m_doc, "--tree", m_folder / "in", "--prefix", "copy"});
    ToolResult const result = Run({"archive", "extract", m_doc, m_folder / "out", "--json"});
    EXPECT_EQ(result.status, 1);
    Json const report = Json::parse(result.out);
    EXPECT_THAT(report["skipped"].get<std::vector<std::string>>(), testing::UnorderedElementsAreArray(bad));
    EXPECT_EQ(report["written"].size(), 6u);
    EXPECT_EQ(ReadWhole(m_folder / "out/copy/sub/b.txt"), std::string(5000, 'b'));
    EXPECT_TRUE(fs::is_regular_file(m_folder / "out/empty"));
    EXPECT_FALSE(fs::exists(m_folder / "out/copy/link"));
    EXPECT_EQ(ReadWhole(secret), "untouched");
    EXPECT_TRUE(fs::is_empty(m_folder / "outside"));
    EXPECT_TRUE(fs::is_empty(m_folder / "out/real"));
    EXPECT_EQ(ReadWhole(m_folder / "out/a.txt"), "alpha");
    for (auto const& entry : fs::recursive_directory_iterator(m_folder / "out"))
        EXPECT_EQ(entry.path().string().find(".kerneltool"), std::string::npos) << entry.path();
}

TEST_F(KernelToolTest, DamageIsListedAndTheRestStaysReadable)
{
    Json const list = RunJson({"archive", "history", m_doc})[0]["entries"];
    std::string bytes = ReadWhole(m_doc);
    bytes[list[0]["filePos"].get<size_t>() + 4 + 9] ^= 1;
    WriteWhole(m_doc, bytes);

    Json const report = RunJson({"archive", "verify", m_doc}, 3);
    ASSERT_EQ(report["damaged"].size(), 1u);
    EXPECT_EQ(KeysOf(report["damaged"][0]), (std::vector<std::string>{"path", "revision", "problem"}));
    EXPECT_EQ(report["damaged"][0]["path"], "a.txt");
    EXPECT_EQ(report["damaged"][0]["revision"], 0);
    EXPECT_EQ(report["checked"], 3);
    EXPECT_EQ(Do({"archive", "cat", m_doc, "sub/b.txt"}), std::string(5000, 'b'));
    EXPECT_THAT(Run({"archive", "cat", m_doc, "a.txt"}).err, HasSubstr("failed: OpenCorrupt (12)"));
    EXPECT_EQ(Run({"archive", "extract", m_doc, m_folder / "out"}).status, 1);
    EXPECT_FALSE(fs::exists(m_folder / "out/a.txt"));
    EXPECT_TRUE(fs::exists(m_folder / "out/sub/b.txt"));

    Do({"archive", "put", m_doc, "--tree", m_folder / "in"});
    EXPECT_EQ(Do({"archive", "cat", m_doc, "a.txt"}), "alpha");
}

TEST_F(KernelToolTest, FailuresNameTheResultAndLeaveTheFileAlone)
{
    WriteWhole(m_folder / "junk", "no document at all, but long enough for a header");
    WriteWhole(m_folder / "short", ReadWhole(m_doc).substr(0, fs::file_size(m_doc) - 70));
    std::string const before = ReadWhole(m_doc);
    struct
    {
        std::vector<std::string> words;
        int status;
        char const* text;
    } const cases[] = {
        {{"archive", "create", m_doc}, 1, "failed: Exists (3)"},
        {{"archive", "create", m_folder / "none/doc"}, 1, "failed: NotFound (2)"},
        {{"archive", "ls", m_folder / "none"}, 1, "failed: OpenNotFound (2)"},
        {{"archive", "ls", m_folder / "in"}, 1, "failed: OpenIsDirectory (26)"},
        {{"archive", "ls", m_folder / "junk"}, 1, "failed: OpenNotArchive (8)"},
        {{"archive", "test", m_folder / "junk"}, 1, "failed: OpenNotArchive (8)"},
        {{"archive", "test", m_folder / "short"}, 3, "failed: OpenCorrupt (12)"},
        {{"archive", "rm", m_doc, "a.txt", "none"}, 1, "failed: OpenNotFound (2)"},
        {{"archive", "put", m_doc, "x=" + m_folder / "none"}, 1, "failed: NotFound (2)"},
        {{"archive", "put", m_doc, "x=" + m_folder / "in"}, 1, "failed: IsDirectory (13)"},
        {{"archive", "put", m_doc, "x=" + m_doc}, 1, "failed: InUse (4)"},
        {{"archive", "put", m_doc, "x=" + m_folder / "junk", "--scratch"}, 1, "failed: SessionNoScratch (6)"},
        {{"archive", "extract", m_doc, m_folder / "junk"}, 1, "failed: "},
        {{"archive", "put", m_doc}, 2, "nothing to put"},
        {{"archive", "put", m_doc, "x"}, 2, "ITEM=SOURCE"},
        {{"archive", "put", m_doc, "x=-", "x=-"}, 2, "standard input"},
        {{"archive", "put", m_doc, "x=-", "--level", "huge"}, 2, "--level is one of"},
        {{"archive", "create", m_folder / "n", "--uid", "toolong"}, 2, "--uid"},
        {{"archive", "ls", m_doc, "--at", "-1"}, 2, "--at"},
        {{"archive", "ls", m_doc, "--zlib"}, 2, "unknown option"},
        {{"archive", "ls"}, 2, "argument is missing"},
        {{"archive", "defragment", m_doc}, 2, "unknown verb"},
        {{"nothing"}, 2, "unknown group"},
        {{}, 2, "no group"},
        {{"stream", "check", m_folder / "junk"}, 3, "failed: NotAStream (1)"},
        {{"stream", "dump", m_folder / "junk", "--json"}, 1, "failed: NotAStream (1)"},
        {{"stream", "dump", m_folder / "none"}, 1, "failed: NotFound (2)"},
    };
    for (auto const& c : cases) {
        ExpectFailure(c.words, c.status, c.text);
    }
    EXPECT_EQ(ReadWhole(m_doc), before);
    ToolResult const full = RunKernelTool({"archive", "cat", m_doc, "a.txt"}, m_folder.GetPath(), {}, "/dev/full");
    EXPECT_EQ(full.status, 1);
    EXPECT_THAT(full.err, HasSubstr("writing standard output failed: OutOfSpace (4)"));
}

TEST_F(KernelToolTest, SecondWriterIsRefusedAndReadersAreNot)
{
    Kernel::Counted<Kernel::Archive> const held = OpenDocument(m_doc);
    ASSERT_TRUE(held);
    ExpectFailure({"archive", "rm", m_doc, "a.txt"}, 1, "failed: OpenReadOnlyArchive (7)\nAnother program");
    EXPECT_EQ(Do({"archive", "cat", m_doc, "a.txt"}), "alpha");
    Do({"archive", "verify", m_doc});
}

TEST_F(KernelToolTest, NamesFromADocumentCannotDriveTheTerminal)
{
    Do({"archive", "put", m_doc, "\x1b[2Jevil\nline=-"}, "x");
    std::string const out = Run({"archive", "ls", m_doc}).out;
    EXPECT_EQ(out.find('\x1b'), std::string::npos);
    EXPECT_THAT(out, HasSubstr("\\x1b[2Jevil\\x0aline"));
    Do({"archive", "put", m_doc, "\xff\xfe=-"}, "x");
    EXPECT_FALSE(RunJson({"archive", "ls", m_doc}).is_discarded());
}

TEST_F(KernelToolTest, StreamDumpShowsWhatWasSaved)
{
    // Header of kind PCFl, then a u32, a string and an array of doubles.
    std::string bytes("\x00\xFFKS\x02\x00lFCP\x03\x00\x18\x00\x00\x00", 16);
    bytes += "\x03"
             "DIUM\x07\0\0\0"s
             "\x2B"
             "emaN\x04\0\0\0text"s
             "\x8A"
             "slaV\x01\0\0\0\0\0\0\0\0\0\xF0\x3F\0"s;
    WriteWhole(m_folder / "stream", bytes);
    EXPECT_EQ(RunJson({"stream", "dump", m_folder / "stream"}), Json::parse(R"(
        {"fileTag": "PCFl", "formatVersion": 2, "fileVersion": 3, "buildIndex": 24, "properties": [
            {"tag": "MUID", "type": 3, "value": 7}, {"tag": "Name", "type": 43, "value": "text"},
            {"tag": "Vals", "type": 10, "array": true, "value": [1.0]}]})"));
    Do({"stream", "check", m_folder / "stream"});
    EXPECT_EQ(Run({"stream", "check", m_folder / "stream", "--zlib"}).status, 3);
    WriteWhole(m_folder / "cut", bytes.substr(0, bytes.size() - 3));
    Json const report = RunJson({"stream", "check", m_folder / "cut"}, 3);
    EXPECT_EQ(report["name"], "Damaged");
    EXPECT_EQ(report["path"], "Vals");
}

TEST_F(KernelToolTest, TextIsSortedAsALanguageSorts)
{
    std::string const text = "\xC3\xB6l10\r\n\xC3\xB6l9\n\nzebra\nZebra\n\xFF";
    struct
    {
        std::vector<std::string> options;
        std::string sorted;
    } const cases[] = {
        {{"--locale", "sv-SE"}, "\nzebra\nZebra\n\xC3\xB6l10\n\xC3\xB6l9\n\xFF\n"},
        {{"--locale", "de-DE", "--numeric"}, "\n\xC3\xB6l9\n\xC3\xB6l10\nzebra\nZebra\n\xFF\n"},
    };
    for (auto const& c : cases) {
        std::vector<std::string> words = {"text", "sort", "-"};
        words.insert(words.end(), c.options.begin(), c.options.end());
        EXPECT_EQ(Run(words, text).out, c.sorted) << c.options[1];
    }
    WriteWhole(m_folder / "lines", "b\na");
    EXPECT_EQ(RunJson({"text", "sort", m_folder / "lines", "--locale", "en"}),
              Json::parse(R"({"locale": "en", "lines": ["a", "b"]})"));
    EXPECT_EQ(Run({"text", "sort", m_folder / "lines", "--locale", "not a locale"}).status, 2);
    EXPECT_EQ(Run({"text", "sort", m_folder / "none"}).status, 1);
    ToolResult const unshown = Run({"text", "sort", "-", "--json"}, "b\xFF\n");
    EXPECT_EQ(unshown.status, 1);
    EXPECT_THAT(unshown.err, HasSubstr("kerneltool: reading standard input failed: IllFormed (1)\n"));
}

// Help, man page and completions say the same as the table of verbs.
TEST_F(KernelToolTest, EveryVerbAndOptionIsDocumented)
{
    std::string const tool = std::string(KERNEL_SOURCE_DIR) + "/Tools/kerneltool/";
    std::string man = ReadWhole(tool + "kerneltool.1");
    for (size_t at; (at = man.find("\\-")) != std::string::npos;) man.erase(at, 1); // Dashes stand for themselves.
    EXPECT_EQ(Do({"--completions", "bash"}), ReadWhole(tool + "completions/kerneltool.bash"));
    EXPECT_EQ(Do({"--completions", "zsh"}), ReadWhole(tool + "completions/_kerneltool"));
    EXPECT_THAT(Run({"--version"}).out, HasSubstr("(build index 24)"));
    EXPECT_THAT(Run({"--help"}).out, HasSubstr("Example:"));
    struct
    {
        char const* group;
        std::vector<char const*> verbs;
    } const groups[] = {{"archive",
                         {"create", "put", "rm", "ls", "cat", "extract", "info", "history", "verify", "test", "scratch",
                          "recover", "streamline", "thumbnail"}},
                        {"stream", {"dump", "check"}},
                        {"text", {"sort", "convert", "detect", "chars"}}};
    for (auto const& group : groups) {
        EXPECT_THAT(Run({group.group, "--help"}).out, HasSubstr("Example:"));
        for (char const* verb : group.verbs) {
            ToolResult const help = Run({group.group, verb, "--help"});
            EXPECT_EQ(help.status, 0);
            EXPECT_THAT(help.out, HasSubstr("Example:\n  kerneltool ")) << verb;
            EXPECT_THAT(man, HasSubstr(std::string(group.group) + " " + verb));
            for (size_t at = help.out.find("\n  --"); at != std::string::npos; at = help.out.find("\n  --", at + 1)) {
                std::string const option = help.out.substr(at + 3, help.out.find(' ', at + 3) - at - 3);
                EXPECT_THAT(man, HasSubstr(option)) << verb;
            }
        }
    }
}

TEST_F(KernelToolTest, RecoverFindsTheNewestStateAndWritesASoundCopy)
{
    std::string const copy = m_folder / "copy";
    Json const sound = RunJson({"archive", "recover", m_doc});
    EXPECT_EQ(KeysOf(sound), (std::vector<std::string>{"recovered", "path", "openResult", "revisions", "items", "to",
                                                       "lost", "checked", "damaged"}));
    EXPECT_EQ(sound["openResult"], 0);
    std::string file = ReadWhole(m_doc);
    file.replace(12, 52, std::string(52, 'x'));
    WriteWhole(m_doc, file);
    EXPECT_EQ(Run({"archive", "ls", m_doc}).status, 1);
    Json const found = RunJson({"archive", "recover", m_doc, "--to", copy});
    EXPECT_EQ(found["openResult"], 13);
    EXPECT_EQ(found["items"], sound["items"]);
    EXPECT_EQ(ReadWhole(m_doc), file);
    Do({"archive", "verify", copy});
    EXPECT_EQ(RunJson({"archive", "info", copy})["items"], sound["items"]);
    EXPECT_EQ(Run({"archive", "recover", m_doc, "--to", copy}).status, 1); // It stands there already.
    WriteWhole(m_doc, file.substr(0, 80));
    ExpectFailure({"archive", "recover", m_doc}, 1, "OpenCorrupt (12)");
}

TEST_F(KernelToolTest, RecoveredCopyHasAllButTheDamagedItemsWhichAreNamed)
{
    std::string const file = ReadWhole(m_doc);
    std::string const copy = m_folder / "copy";
    struct
    {
        char const* item;
        u64 at; ///< The byte of its block that is spoiled.
        char const* problem;
    } const cases[] = {{"a.txt", 0, "BadTag (2)"},
                       {"a.txt", 13, "BadCRC (5)"},
                       {"sub/b.txt", 6, "BadData (4)"},
                       {"a.txt", 18, nullptr}};
    for (auto const& c : cases) {
        SCOPED_TRACE(testing::Message() << c.item << " at " << c.at);
        WriteWhole(m_doc, file);
        std::string spoiled = file;
        Json const history = RunJson({"archive", "history", m_doc});
        for (Json const& entry : history[0]["entries"])
            if (entry["path"] == c.item) spoiled[entry["filePos"].get<u64>() + c.at] ^= 1;
        WriteWhole(m_doc, spoiled);
        fs::remove(copy);
        ToolResult const result = Run({"archive", "recover", m_doc, "--to", copy, "--json"});
        EXPECT_EQ(result.status, c.problem ? 3 : 0);
        EXPECT_EQ(Json::parse(result.out)["lost"].size(), c.problem ? 1u : 0u);
        if (c.problem) {
            EXPECT_THAT(result.err, testing::StartsWith("kerneltool: saving '" + std::string(c.item) +
                                                        "' failed: " + c.problem + "\n"));
        }
        Do({"archive", "verify", copy}); // Its blocks are whole again, the ends too.
        EXPECT_EQ(RunJson({"archive", "ls", copy}).size(), c.problem ? 2u : 3u);
        EXPECT_EQ(ReadWhole(m_doc), spoiled);
    }
}

TEST_F(KernelToolTest, StreamlineLeavesTheItemsAndDropsTheRest)
{
    EXPECT_EQ(RunJson({"archive", "streamline", m_doc})["streamlined"], false);
    Do({"archive", "rm", m_doc, "empty", "--verify"});
    struct
    {
        std::vector<std::string> options;
        std::string file;
        int flags;
    } const calls[] = {{{"--to", m_folder / "copy"}, m_folder / "copy", 0},
                       {{}, m_doc, 4},
                       {{"--overwrite", "--no-verify", "--progress", "always"}, m_doc, 8}};
    for (auto const& call : calls) {
        SCOPED_TRACE(call.options.empty() ? "in place" : call.options[0]);
        Do({"archive", "put", m_doc, "--session", "rewrite", "a.txt=in/sub/b.txt"});
        std::vector<std::string> words = {"archive", "streamline", m_doc};
        words.insert(words.end(), call.options.begin(), call.options.end());
        Json const report = RunJson(words);
        EXPECT_EQ(KeysOf(report),
                  (std::vector<std::string>{"streamlined", "path", "sizeBefore", "sizeAfter", "verified"}));
        EXPECT_LT(report["sizeAfter"], report["sizeBefore"]);
        EXPECT_EQ(fs::file_size(call.file), report["sizeAfter"]);
        Json const info = RunJson({"archive", "info", call.file});
        EXPECT_EQ(info["revisions"], 1);
        EXPECT_EQ(info["items"], 2);
        EXPECT_EQ(info["master"]["flags"], call.flags);
        EXPECT_EQ(Do({"archive", "cat", call.file, "a.txt"}), std::string(5000, 'b'));
        Do({"archive", "verify", call.file});
        EXPECT_FALSE(fs::exists(m_doc + "~streamline"));
    }
    EXPECT_EQ(Run({"archive", "streamline", m_doc, "--to", m_folder / "copy"}).status, 1);
    EXPECT_EQ(Run({"archive", "streamline", m_doc, "--to", m_folder / "new", "--overwrite"}).status, 2);
    EXPECT_FALSE(fs::exists(m_folder / "new"));

    // Damage is kept as it is, and told in the one value.
    std::string spoiled = ReadWhole(m_doc);
    spoiled[76] ^= 1; // In the first item.
    WriteWhole(m_folder / "spoiled", spoiled);
    Json const damaged = RunJson({"archive", "streamline", m_folder / "spoiled", "--to", m_folder / "kept"}, 3);
    ASSERT_TRUE(damaged.is_object());
    EXPECT_EQ(damaged["verified"], false);

    // A block that is not where the table says stops it, and nothing has changed.
    Do({"archive", "put", m_doc, "--session", "rewrite", "a.txt=in/sub/b.txt"});
    std::string bytes = ReadWhole(m_doc);
    bytes[bytes.rfind("#Fil")] = '?';
    WriteWhole(m_doc, bytes);
    ExpectFailure({"archive", "streamline", m_doc}, 1, "failed: StreamlineFailed (2)");
    EXPECT_EQ(ReadWhole(m_doc), bytes);
}

TEST_F(KernelToolTest, ProgressBarStaysOnStandardError)
{
    ToolResult const always = Run({"archive", "verify", m_doc, "--json", "--progress", "always"});
    EXPECT_THAT(always.err, HasSubstr("Verifying ["));
    EXPECT_THAT(always.err, HasSubstr("100 %"));
    EXPECT_FALSE(Json::parse(always.out, nullptr, false).is_discarded());
    EXPECT_EQ(Run({"archive", "verify", m_doc}).err, "");
}

} // namespace
} // namespace KernelTest
