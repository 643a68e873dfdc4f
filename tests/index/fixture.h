#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <memory>
#include <string>

#include "index/search/library.h"
#include "index/store/fields.h"
#include "index/store/writer.h"

namespace maru::index::test {

inline const Identity kRoot{0, {}, true};

/// A folder of its own for each case, with one index "fileindex_photo" in it.
class IndexTest : public testing::Test {
 protected:
  IndexTest() {
    writer_ = std::make_unique<Writer>(Path());
    const FileRights open = Rights(0, 0755);
    Document top;
    top.name = "photo";
    top.is_dir = true;
    top.rights = open;
    Entry entry;
    entry.name = "photo";
    entry.directory = writer_->AddDirectory(0, "", open);
    entry.document = writer_->Add(Prepared(top));
    writer_->SetRoot(entry);
  }
  ~IndexTest() override {
    writer_.reset();
    std::filesystem::remove_all(root_);
  }

  std::string Path() const { return root_ + "/fileindex_photo"; }

  static FileRights Rights(uid_t uid, unsigned mode, gid_t gid = 0) {
    return {uid, gid, static_cast<std::uint16_t>(mode), ""};
  }

  static Document Doc(const std::string& name, const std::string& text,
                      const FileRights& rights = Rights(0, 0644)) {
    Document document;
    document.name = name;
    document.parent = Writer::kRoot;
    document.rights = rights;
    document.text = text;
    document.size = text.size();
    return document;
  }

  DocumentId Add(const std::string& name, const std::string& text,
                 const FileRights& rights = Rights(0, 0644)) {
    return writer_->Add(Prepared(Doc(name, text, rights)));
  }

  std::unique_ptr<View> Read(const Identity& who = kRoot) {
    return library_.Open({"fileindex_photo"}, who);
  }

  static std::vector<Fragment> Fragments(View& view, DocumentId document, const Query& query,
                                         const FragmentOptions& options) {
    const auto hit = view.Find(0, document);
    return hit ? Highlighter(view, query).FragmentsOf(*hit, options) : std::vector<Fragment>();
  }

  static Query Word(const std::string& word, const std::string& field = std::string(kText)) {
    Query query;
    query.kind = Query::Kind::kWord;
    query.words = {word};
    query.fields = {{field, 1}};
    return query;
  }

  static Query Phrase(std::vector<std::string> words) {
    Query query;
    query.kind = Query::Kind::kPhrase;
    query.words = std::move(words);
    query.fields = {{std::string(kText), 1}};
    return query;
  }

  static SearchOptions Page(std::uint32_t size = 10) {
    SearchOptions options;
    options.size = size;
    return options;
  }

  static std::string MakeFolder() {
    char name[] = "/tmp/maru-index-XXXXXX";
    return mkdtemp(name);
  }

  const std::string root_ = MakeFolder();
  std::unique_ptr<Writer> writer_;
  Library library_{root_};
};

}  // namespace maru::index::test
