#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "daemon/core/core.h"
#include "index/store/writer.h"
#include "system/json.h"

namespace maru::daemon::test {

using Strings = std::vector<std::string>;

/// Shares with real files, their real indices, and a core to ask. Two accounts that every machine
/// has stand for users: "bin" and "games".
class DaemonTest : public testing::Test {
 protected:
  DaemonTest() : indices_(root_ + "/index"), usage_(root_ + "/usage.db", [this] { return now_; }) {
    chmod(root_.c_str(), 0755);
    std::filesystem::create_directory(root_ + "/index");
    core_.shares = [this] { return table_; };
    core_.history = [this](uid_t uid) { return history_[uid]; };
  }
  ~DaemonTest() override { std::filesystem::remove_all(root_); }

  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "giving files away takes root";
    bin_ = IdentityOfUser("bin").value();
    games_ = IdentityOfUser("games").value();
    AddShare("photo");
  }

  /// `settings`: more lines of the share, such as "valid users = bin".
  void AddShare(const std::string& name, const std::string& settings = "") {
    std::filesystem::create_directory(root_ + "/" + name);
    settings_ += "[" + name + "]\n\tpath = " + root_ + "/" + name + "\n" +
                 (settings.empty() ? "" : "\t" + settings + "\n");
    table_ = std::make_shared<const ShareTable>(ShareTable::Parse(settings_));
  }

  /// A file ("photo/a.txt") with the folders on the way.
  void File(const std::string& path, const std::string& text, mode_t mode = 0644, uid_t uid = 0) {
    const std::string full = root_ + "/" + path;
    std::filesystem::create_directories(std::filesystem::path(full).parent_path());
    std::ofstream(full) << text;
    ASSERT_EQ(chmod(full.c_str(), mode), 0);
    ASSERT_EQ(chown(full.c_str(), uid, 0), 0);
  }

  /// Makes the share's index from what lies on the disk.
  void Index(const std::string& share = "photo") {
    index::Writer writer(root_ + "/index/fileindex_" + share);
    index::Entry top;
    top.name = share;
    IndexFolder(writer, root_ + "/" + share, 0, top);
    writer.SetRoot(top);
    writer.Commit();
  }

  std::vector<Json::Value> Ask(const Identity& who, const std::string& command,
                               const Json::Value& data = Json::objectValue) {
    Json::Value request;
    request["command"] = command;
    request["data"] = data;
    return Say(who, json::ToString(request));
  }

  std::vector<Json::Value> Say(const Identity& who, const std::string& line) {
    std::vector<Json::Value> messages;
    Answer(
        core_, {who, client_}, line,
        [&](std::string_view message, bool last) {
          Json::Value value;
          EXPECT_TRUE(json::FromString(std::string(message), value)) << message;
          EXPECT_EQ(value.isMember("success"), last);
          messages.push_back(value);
        },
        cancelled_);
    return messages;
  }

  /// The reply's data; null with a failure of the test when there is none.
  Json::Value Data(const Identity& who, const std::string& command, const Json::Value& data) {
    const auto messages = Ask(who, command, data);
    EXPECT_TRUE(messages.back()["success"].asBool()) << json::ToString(messages.back());
    return messages.back()["data"];
  }

  int Code(const Identity& who, const std::string& command, const Json::Value& data) {
    return Ask(who, command, data).back()["error"]["code"].asInt();
  }

  /// As text, for comparing: numbers of different types are different values.
  std::string Told(const Identity& who, const std::string& command, const Json::Value& data) {
    return json::ToString(Data(who, command, data));
  }

  static Json::Value Parsed(const std::string& text) {
    Json::Value value;
    std::string why;
    EXPECT_TRUE(json::FromString(text, value, &why)) << why << ": " << text;
    return value;
  }

  /// The names found, sorted; the total is checked to fit.
  std::vector<std::string> Names(const Identity& who, const std::string& keyword,
                                 const std::string& more_data = "{}") {
    Json::Value data = Parsed(more_data);
    data["pre_query"]["keyword"] = keyword;
    data["load_field"].append("MARUMDFSName");
    data["size"] = 1000;
    const auto messages = Ask(who, "search", data);
    EXPECT_TRUE(messages.back()["success"].asBool()) << json::ToString(messages.back());
    std::vector<std::string> names;
    for (std::size_t i = 1; i + 1 < messages.size(); ++i) {
      names.push_back(messages[i]["MARUMDFSName"].asString());
    }
    EXPECT_EQ(messages.front()["total"].asUInt64(), names.size());
    std::sort(names.begin(), names.end());
    return names;
  }

  static std::string Temporary() {
    std::string path = testing::TempDir() + "daemon-test-XXXXXX";
    return mkdtemp(path.data());
  }

  const std::string root_ = Temporary();
  const Identity root_user_{0, {0}, true};
  Identity bin_, games_;
  std::int64_t now_ = 1'800'000'000;
  std::map<uid_t, Strings> history_;
  ClientAddress client_ = ClientAddress::OfThisMachine();
  CancelCheck cancelled_ = [] { return false; };
  std::string settings_ = "[global]\n";
  std::shared_ptr<const ShareTable> table_;
  LibraryIndices indices_;
  UsageStore usage_;
  Core core_{.indices = indices_, .usage = usage_};

  /// A hit as the index has it for what lies at a path of a share.
  index::Hit HitAt(const std::string& share, const std::string& path) const {
    const index::Document document = DocumentOf(root_ + "/" + share + path, 0);
    index::Hit hit;
    hit.path = path;
    hit.record.inode = document.inode;
    hit.record.is_dir = document.is_dir;
    return hit;
  }

 private:
  void IndexFolder(index::Writer& writer, const std::string& path, index::DirectoryId parent,
                   index::Entry& entry) {
    index::Document document = DocumentOf(path, parent);
    entry.directory = writer.AddDirectory(parent, parent ? entry.name : "", document.rights);
    document.is_dir = true;
    entry.document = writer.Add(index::Prepared(document));
    std::vector<index::Entry> entries;
    for (const auto& item : std::filesystem::directory_iterator(path)) {
      index::Entry inside;
      inside.name = item.path().filename();
      if (item.is_directory()) {
        IndexFolder(writer, item.path(), entry.directory, inside);
      } else {
        inside.document = writer.Add(index::Prepared(DocumentOf(item.path(), entry.directory)));
      }
      entries.push_back(inside);
    }
    std::sort(entries.begin(), entries.end(),
              [](const auto& a, const auto& b) { return a.name < b.name; });
    writer.SetEntries(entry.directory, entries);
  }

  static index::Document DocumentOf(const std::string& path, index::DirectoryId parent) {
    index::Document document;
    document.name = std::filesystem::path(path).filename();
    document.parent = parent;
    EXPECT_TRUE(ReadFileRights(AT_FDCWD, path.c_str(), document.rights));
    struct stat status {};
    stat(path.c_str(), &status);
    document.size = static_cast<std::uint64_t>(status.st_size);
    document.mtime = status.st_mtime;
    document.inode = status.st_ino;
    document.is_dir = S_ISDIR(status.st_mode);
    if (document.is_dir) return document;
    std::ifstream file(path);
    document.text.assign(std::istreambuf_iterator<char>(file), {});
    return document;
  }
};

}  // namespace maru::daemon::test
