// Reads and writes of which the kernel makes less than was asked for, those of C streams included:
// they change nothing but the number of calls.

#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <map>

#include "kelodrcore/file.h"
#include "kelodrcore/json_value.h"
#include "support/clean_test.h"
#include "support/tracer.h"

namespace {

namespace File = KeloDRCore::File;
namespace JsonValue = KeloDRCore::JsonValue;

constexpr char kDocument[] = "{\"document\":[1,2.5,\"text\"]}";

class ShortTransferTest : public CleanTest {
 protected:
  void SetUp() override {
    CleanTest::SetUp();
    std::filesystem::create_directory(Path("data"));
    path = Path("data/file");
    ASSERT_TRUE(JsonValue::fromString(document, kDocument));
  }

  // Cuts all transfers of `body` from the first one on, then from the second one on, until none is
  // left. The file holds `text` before; `body` answers true, logs nothing and leaves `after`.
  void Sweep(const std::string& text, const std::function<bool()>& body, const std::string& after) {
    const std::string ack = Path("ack");
    int cut = 1;
    for (int first = 1; cut > 0; ++first) {
      WriteText(path, text);
      unlink(ack.c_str());
      cut = Tracer::CutTransfers(Path("data"), first, [&] {
        if (body() && LogCapture::Take().empty()) WriteText(ack, "");
      });
      EXPECT_EQ(access(ack.c_str(), F_OK), 0) << "from transfer " << first << " on";
      EXPECT_EQ(ReadText(path), after) << "from transfer " << first << " on";
      EXPECT_TRUE(cut > 0 || first > 1) << "nothing was moved";
    }
  }

  std::string path;
  Json::Value document;
};

}  // namespace

TEST_F(ShortTransferTest, ReadsADocument) {
  const auto body = [this] {
    Json::Value value;
    return File::Read(path, value) && value == document;
  };
  Sweep(kDocument, body, kDocument);
}

TEST_F(ShortTransferTest, ReadsADocumentFromADescriptor) {
  const auto body = [this] {
    Json::Value value;
    return File::Read(open(path.c_str(), O_RDONLY | O_CLOEXEC), value) && value == document;
  };
  Sweep(kDocument, body, kDocument);
}

TEST_F(ShortTransferTest, ReadsKeysAndValues) {
  const std::map<std::string, int> expected = {{"a", 1}, {"b", 22}};
  const auto body = [&] {
    std::map<std::string, int> map;
    return File::Read(path, map) == 2 && map == expected;
  };
  Sweep("a=1\nb=22\n", body, "a=1\nb=22\n");
}

TEST_F(ShortTransferTest, WritesADocument) {
  Sweep(
      "old", [this] { return File::Write(path, document); }, kDocument);
}

TEST_F(ShortTransferTest, WritesADocumentToADescriptor) {
  const auto body = [this] {
    return File::Write(open(path.c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC), document);
  };
  Sweep("old", body, kDocument);
}

TEST_F(ShortTransferTest, ReplacesADocument) {
  Sweep(
      "old", [this] { return JsonValue::toFile(document, path); }, kDocument);
}

// The limit lets a part of the text through before it fails the write.
TEST_F(ShortTransferTest, AWriteThatFailsAfterAPartIsTold) {
  EXPECT_EQ(RunInChild([this] {
              signal(SIGXFSZ, SIG_IGN);
              const rlimit ten{10, 10};
              ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &ten), 0);
              EXPECT_FALSE(File::Write(path, document));
              ExpectLog({Err("file.cpp", "Write", "Failed to flush file[" + path + "]")});
            }),
            0);
  EXPECT_EQ(ReadText(path), std::string(kDocument, 10));
}

TEST_F(ShortTransferTest, AReplacementThatFailsAfterAPartLeavesTheOldDocument) {
  WriteText(path, "\"old\"");
  EXPECT_EQ(RunInChild([this] {
              signal(SIGXFSZ, SIG_IGN);
              const rlimit ten{10, 10};
              ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &ten), 0);
              EXPECT_FALSE(JsonValue::toFile(document, path));
            }),
            0);
  EXPECT_EQ(ReadText(path), "\"old\"");
  EXPECT_EQ(NamesIn(Path("data")), std::vector<std::string>{"file"});
}
