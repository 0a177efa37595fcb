#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "kivi/net/url.h"
#include "kivi/text/json_serialization.h"

namespace kivi {
namespace {

namespace fs = std::filesystem;

class Bookmarks : public ::testing::Test {
 protected:
  void SetUp() override {
    char pattern[] = "/tmp/kivi-bookmark-XXXXXX";
    ASSERT_NE(::mkdtemp(pattern), nullptr);
    dir_ = pattern;
    fs::create_directories(dir_ + "/a");
  }
  void TearDown() override { fs::remove_all(dir_); }
  std::string make(const std::string& name) {
    std::string path = dir_ + "/" + name;
    std::ofstream(path) << "contents";
    return path;
  }
  std::string dir_;
};

URLPtr resolve(const Data& data, bool& stale, ErrorPtr& error) {
  stale = false;
  return URL::URLByResolvingBookmarkData(data, 0, nullptr, &stale, &error);
}

TEST_F(Bookmarks, FollowTheFileWhenItMoves) {
  const std::string original = make("a/notes.txt");
  ErrorPtr error;
  auto bookmark =
      URL::fileURLWithPath(original)->bookmarkDataWithOptions(0, std::nullopt, nullptr, &error);
  ASSERT_TRUE(bookmark) << error->description();

  bool stale = true;
  auto found = resolve(*bookmark, stale, error);
  ASSERT_NE(found, nullptr);
  EXPECT_EQ(found->path(), original);
  EXPECT_FALSE(stale);

  // Renamed, then moved into a new sibling directory tree.
  fs::rename(original, dir_ + "/a/renamed.txt");
  found = resolve(*bookmark, stale, error);
  ASSERT_NE(found, nullptr);
  EXPECT_EQ(found->path(), dir_ + "/a/renamed.txt");
  EXPECT_TRUE(stale);
  fs::create_directories(dir_ + "/b/c");
  fs::rename(dir_ + "/a/renamed.txt", dir_ + "/b/c/moved.txt");
  fs::remove_all(dir_ + "/a");
  found = resolve(*bookmark, stale, error);
  ASSERT_NE(found, nullptr);
  EXPECT_EQ(found->path(), dir_ + "/b/c/moved.txt");

  // Gone: a file put at the recorded place stands in for it.
  fs::remove(dir_ + "/b/c/moved.txt");
  EXPECT_EQ(resolve(*bookmark, stale, error), nullptr);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), CocoaErrorDomain);
  EXPECT_EQ(error->code(), FileReadNoSuchFileError);
  fs::create_directories(dir_ + "/a");
  make("a/notes.txt");
  found = resolve(*bookmark, stale, error);
  ASSERT_NE(found, nullptr);
  EXPECT_EQ(found->path(), original);
  EXPECT_TRUE(stale);
}

TEST_F(Bookmarks, WriteAndReadBack) {
  const std::string file = make("a/doc");
  ErrorPtr error;
  auto bookmark = URL::fileURLWithPath(file)->bookmarkDataWithOptions(0, std::vector<std::string>{},
                                                                      nullptr, &error);
  ASSERT_TRUE(bookmark);
  auto store = URL::fileURLWithPath(dir_ + "/doc.bookmark");
  EXPECT_TRUE(URL::classObject()->writeBookmarkData(*bookmark, store, 0, &error));
  EXPECT_EQ(error, nullptr);
  EXPECT_EQ(URL::bookmarkDataWithContentsOfURL(store, &error), bookmark);

  struct Case {
    Data data;
    URLPtr url;
    std::int64_t code;
  } cases[] = {
      {*bookmark, URL::fileURLWithPath(dir_ + "/missing/doc.bookmark"), FileNoSuchFileError},
      {Data{'n', 'o', 'p', 'e'}, store, FileWriteUnknownError},
      {*bookmark, URL::URLWithString("https://example.com/x"), FileWriteInvalidFileNameError},
      {*bookmark, nullptr, FileWriteInvalidFileNameError},
  };
  for (const auto& c : cases) {
    error = nullptr;
    EXPECT_FALSE(URL::writeBookmarkDataToURL(c.data, c.url, 0, &error));
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->code(), c.code);
  }
  if (::geteuid() != 0) {
    ::chmod(dir_.c_str(), 0500);
    EXPECT_FALSE(URL::writeBookmarkDataToURL(*bookmark, store, 0, &error));
    EXPECT_EQ(error->code(), FileWriteNoPermissionError);
    ::chmod(dir_.c_str(), 0700);
  }
  // Nothing but the bookmark itself was left in the directory.
  EXPECT_EQ(std::distance(fs::directory_iterator(dir_), fs::directory_iterator()), 2);

  std::ofstream(dir_ + "/junk") << "junk";
  EXPECT_EQ(URL::bookmarkDataWithContentsOfURL(URL::fileURLWithPath(dir_ + "/junk"), &error),
            std::nullopt);
  EXPECT_EQ(error->code(), FileReadCorruptFileError);
  bool stale = false;
  EXPECT_EQ(resolve(Data{1, 2, 3}, stale, error), nullptr);
  EXPECT_EQ(error->code(), FileReadCorruptFileError);
}

TEST_F(Bookmarks, MissingFilesAndOddPaths) {
  ErrorPtr error;
  auto missing = URL::fileURLWithPath(dir_ + "/none");
  EXPECT_EQ(missing->bookmarkDataWithOptions(0, std::nullopt, nullptr, &error), std::nullopt);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), FileReadNoSuchFileError);
  const String* path = error->userInfo().at(FilePathErrorKey).asString();
  ASSERT_NE(path, nullptr);
  EXPECT_EQ(std::string_view(*path), dir_ + "/none");
  EXPECT_EQ(URL::URLWithString("https://example.com/")
                ->bookmarkDataWithOptions(0, std::nullopt, nullptr, &error),
            std::nullopt);

  // Any bytes but NUL make a file URL, and come back unchanged.
  const std::string odd = dir_ + "/\xff name?#%.txt";
  auto url = URL::fileURLWithPath(odd);
  ASSERT_NE(url, nullptr);
  EXPECT_TRUE(url->isFileURL());
  EXPECT_EQ(url->fileSystemRepresentation(), odd);
  EXPECT_EQ(url->path(), std::nullopt);  // not UTF-8
  std::ofstream(odd) << "x";
  auto bookmark = url->bookmarkDataWithOptions(0, std::nullopt, nullptr, &error);
  ASSERT_TRUE(bookmark);
  bool stale = false;
  auto found = resolve(*bookmark, stale, error);
  ASSERT_NE(found, nullptr);
  EXPECT_EQ(found->fileSystemRepresentation(), odd);

  EXPECT_EQ(URL::fileURLWithPath(std::string("/a\0b", 4)), nullptr);
  EXPECT_EQ(URL::fileURLWithPath(""), nullptr);
  EXPECT_EQ(URL::fileURLWithPath("relative/x")->fileSystemRepresentation(),
            fs::current_path().string() + "/relative/x");
  EXPECT_EQ(URL::URLWithString("file:///a%00b")->fileSystemRepresentation(), std::nullopt);
}

}  // namespace
}  // namespace kivi
