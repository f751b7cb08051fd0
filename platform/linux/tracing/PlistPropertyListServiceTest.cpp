#include "platform/linux/tracing/PlistPropertyListService.h"

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <span>
#include <string>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

class PlistPropertyListServiceTest : public testing::Test {
 protected:
  static bool runs(const std::string& command) {
    return std::system((command + " >/dev/null 2>&1").c_str()) == 0;
  }
  // Lets Python write this value in that form.
  bool writeByPython(const std::string& name, const std::string& value, const std::string& form) {
    const std::filesystem::path script = scratch_ / "write.py";
    std::ofstream(script) << "import datetime, plistlib\n"
                          << "with open('" << (scratch_ / name).string() << "', 'wb') as file:\n"
                          << "    plistlib.dump(" << value << ", file, fmt=plistlib.FMT_" << form
                          << ", sort_keys=False)\n";
    return runs("/usr/bin/python3 " + script.string());
  }
  std::optional<Value> load(const std::string& name) {
    return service_.parse(service_.readFile((scratch_ / name).string(), error_), error_);
  }
  std::optional<Value> parse(std::string_view text) {
    return service_.parse(Data(std::as_bytes(std::span(text.data(), text.size()))), error_);
  }
  // The error's text; empty if there is none.
  std::string failure(std::string_view text) {
    error_.reset();
    return parse(text).has_value() ? "" : error_.value_or(Error{}).description;
  }

  const ScratchDirectory directory_;
  const std::filesystem::path scratch_ = directory_.path();
  const PlistPropertyListService service_{};
  std::optional<Error> error_;
};

constexpr const char* kEveryKind =
    "{'text': 'R\\u00e4ume', 'number': 42, 'negative': -5, 'large': 2**64 - 1, 'real': 0.25,"
    " 'yes': True, 'no': False, 'date': datetime.datetime(2026, 11, 21, 6, 50, 0),"
    " 'data': b'\\x00\\x01\\xff', 'list': [1, 'two', {'three': 3}], 'empty': {}}";

void expectEveryKind(const std::optional<Value>& root) {
  ASSERT_TRUE(root.has_value());
  const std::array<std::byte, 3> bytes{std::byte{0}, std::byte{1}, std::byte{0xFF}};
  const Dictionary expected{
      {"text", "R\u00e4ume"}, {"number", 42},
      {"negative", -5},       {"large", UINT64_MAX},
      {"real", 0.25},         {"yes", true},
      {"no", false},          {"date", Date{1'795'243'800}},
      {"data", Data(bytes)},  {"list", Array{1, "two", Dictionary{{"three", 3}}}},
      {"empty", Dictionary{}}};
  EXPECT_EQ(*root, Value(expected)) << describe(*root);
}

TEST_F(PlistPropertyListServiceTest, EveryKindOfValueComesFromXmlThatPythonWrote) {
  if (!writeByPython("list", kEveryKind, "XML")) GTEST_SKIP() << "there is no Python with plistlib";

  expectEveryKind(load("list"));
}

TEST_F(PlistPropertyListServiceTest, EveryKindOfValueComesFromBinaryThatPythonWrote) {
  if (!writeByPython("list", kEveryKind, "BINARY")) {
    GTEST_SKIP() << "there is no Python with plistlib";
  }

  expectEveryKind(load("list"));
}

TEST_F(PlistPropertyListServiceTest, EveryKindOfValueComesFromFilesThatPlistutilConverted) {
  const std::string path = (scratch_ / "list").string();
  if (!writeByPython("list", kEveryKind, "XML") ||
      !runs("plistutil -i " + path + " -o " + path + ".bin") ||
      !runs("plistutil -i " + path + ".bin -o " + path + ".xml")) {
    GTEST_SKIP() << "there is no Python with plistlib, or no plistutil";
  }

  expectEveryKind(load("list.bin"));
  expectEveryKind(load("list.xml"));
}

TEST_F(PlistPropertyListServiceTest, RootMayBeAnyValue) {
  EXPECT_EQ(parse("<plist><string>alone</string></plist>"), Value("alone"));
  EXPECT_EQ(parse("<plist><array/></plist>"), Value(Array{}));
}

TEST_F(PlistPropertyListServiceTest, FileThatIsMissingIsAnErrorThatNamesThePath) {
  const std::string path = (scratch_ / "missing").string();

  EXPECT_FALSE(service_.readFile(path, error_).has_value());

  ASSERT_TRUE(error_.has_value());
  EXPECT_EQ(error_->code, ENOENT);
  EXPECT_NE(error_->description.find(path), std::string::npos) << error_->description;
}

TEST_F(PlistPropertyListServiceTest, PipeWithoutWriterIsAnErrorAtOnce) {
  const std::string path = (scratch_ / "pipe").string();
  ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);

  EXPECT_FALSE(service_.readFile(path, error_).has_value());
  EXPECT_TRUE(error_.has_value());
}

TEST_F(PlistPropertyListServiceTest, DirectoryAndDeviceAreErrors) {
  EXPECT_FALSE(service_.readFile(scratch_.string(), error_).has_value());
  EXPECT_EQ(error_.value_or(Error{}).code, EISDIR);
  EXPECT_FALSE(service_.readFile("/dev/zero", error_).has_value());
}

TEST_F(PlistPropertyListServiceTest, FileThatIsTooLargeIsNotRead) {
  const std::filesystem::path path = scratch_ / "large";
  std::ofstream(path).put(' ');
  std::filesystem::resize_file(path, PlistPropertyListService::kMostFileBytes + 1);

  EXPECT_FALSE(service_.readFile(path.string(), error_).has_value());
  EXPECT_EQ(error_.value_or(Error{}).code, EFBIG);
}

TEST_F(PlistPropertyListServiceTest, BytesThatAreNoListAreErrors) {
  EXPECT_FALSE(service_.parse(std::nullopt, error_).has_value());
  EXPECT_EQ(failure(""), "the property list is empty");
  EXPECT_NE(failure("neither"), "");
  EXPECT_NE(failure("<plist><dict><key>a</key></plist>"), "");
  EXPECT_EQ(failure("bplist00"), "the property list is not a binary property list");
}

std::string nested(std::size_t levels) {
  std::string text = "<plist>";
  for (std::size_t level = 0; level < levels; ++level) text += "<array>";
  for (std::size_t level = 0; level < levels; ++level) text += "</array>";
  return text + "</plist>";
}

TEST_F(PlistPropertyListServiceTest, XmlMayHave64LevelsAndNoMore) {
  EXPECT_EQ(failure(nested(64)), "");
  EXPECT_EQ(failure(nested(65)), "the property list is nested too deeply");
  EXPECT_EQ(failure(nested(1'000'000)), "the property list is nested too deeply");
}

TEST_F(PlistPropertyListServiceTest, ClosingTagsInCommentsDoNotHideDepth) {
  std::string text = "<plist>";
  for (int level = 0; level < 100'000; ++level) text += "<array><!-- </array> -->";

  EXPECT_EQ(failure(text), "the property list is nested too deeply");
}

TEST_F(PlistPropertyListServiceTest, CommentsAndDocumentTypesAreAllowed) {
  EXPECT_EQ(parse("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
                  "<!DOCTYPE plist PUBLIC \"-//Example//DTD 1.0//EN\" \"http://example.org/1.0\">\n"
                  "<plist version=\"1.0\"><!-- it's \"odd --><integer>7</integer></plist>\n"),
            Value(7));
}

// A binary list of arrays, each with two references to the next one.
std::string doubling(unsigned char levels) {
  std::string bytes = "bplist00";
  for (unsigned char level = 0; level < levels; ++level) {
    bytes += '\xA2';
    bytes.append(2, static_cast<char>(level + 1));
  }
  bytes += '\x08';  // false
  const std::size_t table = bytes.size();
  for (unsigned char object = 0; object <= levels; ++object) {
    bytes += static_cast<char>(8 + object * 3);
  }
  bytes += std::string("\0\0\0\0\0\0\1\1", 8);
  for (const auto number : {static_cast<std::size_t>(levels) + 1, std::size_t{0}, table}) {
    bytes += std::string(7, '\0') + static_cast<char>(number);
  }
  return bytes;
}

TEST_F(PlistPropertyListServiceTest, BinaryListsCannotGrowBySharing) {
  EXPECT_EQ(failure(doubling(10)), "");
  EXPECT_EQ(failure(doubling(40)), "the property list has too many values or too much text");
}

TEST_F(PlistPropertyListServiceTest, BinaryListThatContainsItselfIsAnError) {
  std::string bytes = doubling(2);
  bytes[9] = '\0';  // the root's first reference

  EXPECT_EQ(failure(bytes), "the property list contains itself");
}

TEST_F(PlistPropertyListServiceTest, TextThatIsNotUtf8IsReplaced) {
  EXPECT_EQ(parse("<plist><string>a\xFFz</string></plist>"), Value("a\uFFFDz"));
}

TEST_F(PlistPropertyListServiceTest, CurrentDirectoryIsThatOfTheProcess) {
  EXPECT_EQ(service_.currentDirectory(), std::filesystem::current_path().string());
}

}  // namespace
}  // namespace halvox::platform::linux_
