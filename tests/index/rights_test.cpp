#include <algorithm>
#include <random>

#include "tests/index/fixture.h"

namespace maru::index::test {
namespace {

/// A document is seen when every folder on the way can be entered and the document itself be read.
TEST_F(IndexTest, EachSeesWhatThatUserMayRead) {
  std::mt19937 random(20);
  const uid_t users[] = {60001, 60002};
  const gid_t groups[] = {60101, 60102};
  const auto any_rights = [&] {
    const unsigned modes[] = {0755, 0700, 0750, 0710, 0711, 0640, 0604, 0044, 0};
    return Rights(users[random() % 2], modes[random() % std::size(modes)], groups[random() % 2]);
  };
  struct Folder {
    DirectoryId id;
    std::size_t parent;
    FileRights rights;
  };
  std::vector<Folder> folders{{Writer::kRoot, 0, Rights(0, 0755)}};
  for (int i = 0; i < 400; ++i) {
    const std::size_t parent = random() % folders.size();
    const FileRights rights = random() % 3 ? Rights(0, 0755) : any_rights();
    folders.push_back({writer_->AddDirectory(folders[parent].id, "d" + std::to_string(i), rights),
                       parent, rights});
  }
  struct File {
    DocumentId id;
    std::size_t folder;
    FileRights rights;
  };
  std::vector<File> files;
  for (int i = 0; i < 2000; ++i) {
    const std::size_t folder = random() % folders.size();
    Document document = Doc("f" + std::to_string(i), "word", any_rights());
    document.parent = folders[folder].id;
    files.push_back({writer_->Add(Prepared(document)), folder, document.rights});
  }
  writer_->Commit();

  const auto check = [&] {
    for (const Identity& who : {Identity{60001, {60001, 60101}, false},
                                Identity{60002, {60102}, false}, Identity{60009, {}, false}}) {
      std::set<DocumentId> expected;
      for (const File& file : files) {
        bool seen = RightsOf(who, file.rights) & kACLRead;
        for (std::size_t at = file.folder; seen; at = folders[at].parent) {
          seen = RightsOf(who, folders[at].rights) & kACLExecute;
          if (at == 0) break;
        }
        if (seen) expected.insert(file.id);
      }
      auto reader = Read(who);
      const SearchResult result = reader->Search(Word("word"), Page(5000));
      EXPECT_EQ(result.total, expected.size());
      std::set<DocumentId> got;
      for (const Hit& hit : result.hits) got.insert(hit.document);
      EXPECT_EQ(got, expected);
      for (const File& file : files) {
        ASSERT_EQ(reader->Find(0, file.id).has_value(), expected.contains(file.id));
      }
    }
  };
  check();
  // Rights change by one row each.
  for (int round = 0; round < 3; ++round) {
    for (int i = 0; i < 40; ++i) {
      const std::size_t at = 1 + random() % (folders.size() - 1);
      folders[at].rights = any_rights();
      writer_->SetDirectory(folders[at].id, folders[folders[at].parent].id, "d",
                            folders[at].rights);
    }
    writer_->Commit();
    check();
  }
}

TEST_F(IndexTest, NothingIsSuggestedOrShownFromWhatOneMayNotRead) {
  const DocumentId secret = Add("secret.txt", "palimpsest secretword", Rights(60002, 0600));
  Add("open.txt", "palimony openword", Rights(60002, 0644));
  writer_->Commit();
  const Identity alice{60001, {60101}, false};
  auto reader = Read(alice);
  EXPECT_EQ(reader->Complete("", "pali", 10), (std::vector<std::string>{"palimony"}));
  EXPECT_EQ(reader->Correct("palimpsets", 10), (std::vector<std::string>{}));
  EXPECT_EQ(reader->Correct("palimonyy", 10), (std::vector<std::string>{"palimony"}));
  EXPECT_TRUE(Fragments(*reader, secret, Word("secretword"), {std::string(kText), 60, 1}).empty());
  EXPECT_EQ(Read({60002, {60102}, false})->Complete("", "pali", 10).size(), 2u);
}

/// A ring, or a row without a way up, is nobody's to see.
TEST_F(IndexTest, BrokenRowsHideWhatIsInThem) {
  const FileRights open = Rights(0, 0755);
  const DirectoryId a = writer_->AddDirectory(Writer::kRoot, "a", open);
  const DirectoryId b = writer_->AddDirectory(a, "b", open);
  Document document = Doc("f", "word");
  document.parent = b;
  writer_->Add(Prepared(document));
  writer_->SetDirectory(a, b, "a", open);
  writer_->Commit();
  EXPECT_EQ(Read({60001, {}, false})->Search(Word("word"), Page()).total, 0u);
}

}  // namespace
}  // namespace maru::index::test
