#include "index/store/writer.h"

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <map>

#include "index/store/aliases.h"
#include "index/store/bulk.h"
#include "index/store/change_log.h"
#include "index/store/codec.h"
#include "index/store/directory_table.h"
#include "index/store/engine.h"
#include "index/store/fields.h"
#include "index/store/prepared.h"
#include "index/store/texts.h"

namespace maru::index {
namespace {

void RemoveAll(const std::string& folder, bool (*which)(const std::string& name)) {
  std::error_code ignored;
  for (const auto& entry : std::filesystem::directory_iterator(folder, ignored)) {
    if (which(entry.path().filename())) std::filesystem::remove_all(entry.path());
  }
}

/// Left behind by a first crawl that was cut off.
bool IsUnfinished(const std::string& name) {
  return name.starts_with("part.") || name == kNewDatabaseFolder + 1;
}

bool IsAnything(const std::string&) {
  return true;
}

Xapian::WritableDatabase OpenDatabase(const std::string& path) {
  return Xapian::WritableDatabase(path, Xapian::DB_CREATE_OR_OPEN | Xapian::DB_BACKEND_GLASS);
}

/// Makes the folder where there is none, and empties an index of another format.
Xapian::WritableDatabase OpenIndex(const std::string& path) {
  // Left alone, the engine commits by itself after so many documents; here only Commit does.
  setenv("XAPIAN_FLUSH_THRESHOLD", "100000000", 1);
  if (mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) {
    throw maruseeker::Error(maruseeker::kErrorStorage,
                            "Cannot make " + path + ": " + std::strerror(errno));
  }
  return WithEngine("Cannot open the index", [&] {
    Xapian::WritableDatabase database = OpenDatabase(path + kDatabaseFolder);
    RemoveAll(path, IsUnfinished);
    const std::string format = database.get_metadata(kFormatKey);
    if (format == kFormat) return database;
    if (!format.empty() || database.get_doccount() > 0) {
      database.close();
      RemoveAll(path, IsAnything);
      database = OpenDatabase(path + kDatabaseFolder);
    }
    database.set_metadata(kFormatKey, kFormat);
    database.set_metadata(Aliases::kMetadata, Aliases::NewKey());
    database.commit();
    return database;
  });
}

}  // namespace

struct Writer::State {
  explicit State(const std::string& path)
      : folder(path), main(OpenIndex(path)), database(main), texts(path) {
    WithEngine("Cannot read the index", [&] {
      table.Load(Read());
      const std::string live = database.get_metadata(kTextsKey);
      for (Decoder in(live); !in.AtEnd();) {
        const std::uint32_t segment = in.Number32();
        live_texts[segment] = in.Number();
      }
    });
  }

  MetadataReader Read() {
    return [this](const std::string& key) { return database.get_metadata(key); };
  }

  /// Completes a document with what only the writer knows.
  void Place(Xapian::Document& engine, const Document& document, const TextPlace& text) {
    index::Place place{document.parent, table.RightsIdOf(document.rights),
                       KindNumber(KindOf(document)),
                       static_cast<std::uint32_t>(HashWord(document.name))};
    engine.add_value(kPlaceSlot, place.Encode());
    const Record record{document.name,  document.is_dir, document.size,   document.mtime,
                        document.inode, document.title,  document.authors};
    engine.set_data(Stored{place, text, record}.Encode());
    engine.add_value(kTextSlot, text.Encode());
    engine.add_value(static_cast<Xapian::valueno>(FindField(kSize)->slot),
                     Xapian::sortable_serialise(static_cast<double>(document.size)));
    engine.add_value(static_cast<Xapian::valueno>(FindField(kModTime)->slot),
                     Xapian::sortable_serialise(static_cast<double>(document.mtime)));
  }

  void Complete(Prepared::Parts& parts) {
    const TextPlace text = texts.Append(parts.packed_text);
    live_texts[text.segment] += text.length;
    Place(parts.engine, parts.document, text);
    // The bulk builder bounds its memory itself.
    if (!bulk) pending += parts.size;
  }

  void ForgetText(DocumentId id) {
    const TextPlace text = Stored::Decode(database.get_document(id).get_data()).text;
    std::uint64_t& live = live_texts[text.segment];
    live -= std::min(live, text.length);
  }

  void SweepTexts();
  void CopyTexts(const std::vector<std::uint32_t>& segments);

  void BeginBulk();
  void EndBulk();
  void CommitDatabase();

  std::string folder;
  /// Keeps the lock of the index for as long as the Writer lives.
  Xapian::WritableDatabase main;
  /// Where things are written: the index itself, or, during a first crawl, a database for the
  /// metadata alone beside the parts with the documents.
  Xapian::WritableDatabase database;
  std::unique_ptr<BulkBuilder> bulk;
  TextWriter texts;
  DirectoryTable table;
  ChangeLog changes;
  bool table_changed = false;
  std::map<std::uint32_t, std::uint64_t> live_texts;
  std::size_t pending = 0;
};

/// Segments of which less than half is still some document's text are copied and removed.
void Writer::State::SweepTexts() {
  std::vector<std::uint32_t> sparse;
  for (const auto& [segment, size] : texts.SegmentSizes()) {
    if (size > 0 && live_texts[segment] < size / 2) sparse.push_back(segment);
  }
  if (sparse.empty()) return;
  pending = 1;
  texts.Turn();
  CopyTexts(sparse);
}

void Writer::State::CopyTexts(const std::vector<std::uint32_t>& segments) {
  TextReader reader(folder);
  std::vector<DocumentId> documents;
  for (auto value = database.valuestream_begin(kTextSlot);
       value != database.valuestream_end(kTextSlot); ++value) {
    const TextPlace text = TextPlace::Decode(*value);
    if (std::find(segments.begin(), segments.end(), text.segment) != segments.end()) {
      documents.push_back(value.get_docid());
    }
  }
  for (const DocumentId id : documents) {
    Xapian::Document engine = database.get_document(id);
    Stored stored = Stored::Decode(engine.get_data());
    stored.text = texts.Append(reader.ReadPacked(stored.text));
    live_texts[stored.text.segment] += stored.text.length;
    engine.set_data(stored.Encode());
    engine.add_value(kTextSlot, stored.text.Encode());
    database.replace_document(id, engine);
  }
  for (const std::uint32_t segment : segments) live_texts.erase(segment);
}

/// A fresh index is built in parts and appears whole: nobody could see it grow anyway.
void Writer::State::BeginBulk() {
  database = OpenDatabase(folder + kMetadataPart);
  for (const char* key : {kFormatKey, Aliases::kMetadata}) {
    database.set_metadata(key, main.get_metadata(key));
  }
  bulk = std::make_unique<BulkBuilder>(folder);
}

void Writer::State::EndBulk() {
  changes.AddEverything();
  CommitDatabase();
  database.close();
  const std::string merged = folder + kNewDatabaseFolder;
  bulk->Merge(folder + kMetadataPart, merged);
  bulk.reset();
  Xapian::WritableDatabase next(merged, Xapian::DB_OPEN);
  if (renameat2(AT_FDCWD, merged.c_str(), AT_FDCWD, (folder + kDatabaseFolder).c_str(),
                RENAME_EXCHANGE) != 0) {
    throw maruseeker::Error(
        maruseeker::kErrorStorage,
        std::string("Cannot put the new index in place: ") + std::strerror(errno));
  }
  main.close();
  next.close();
  main = database = OpenDatabase(folder + kDatabaseFolder);
  std::filesystem::remove_all(merged);
}

void Writer::State::CommitDatabase() {
  texts.Sync();
  const MetadataWriter write = [&](const std::string& key, const std::string& value) {
    database.set_metadata(key, value);
  };
  // Kept over a commit that fails: Save has forgotten it by then.
  table_changed = table_changed || table.Changed();
  table.Save(write);
  changes.Save(write, table.Commit(), table_changed);
  Encoder live;
  for (const auto& [segment, bytes] : live_texts) live.Number(segment).Number(bytes);
  database.set_metadata(kTextsKey, live.Take());
  database.commit();
  changes.Clear();
  table_changed = false;
  pending = 0;
}

Writer::Writer(const std::string& path) : state_(std::make_unique<State>(path)) {
  WithEngine("Cannot tidy the index", [&] {
    state_->SweepTexts();
    if (state_->table.Commit() == 0)
      state_->BeginBulk();
    else
      Commit();
  });
  for (const auto& [segment, size] : state_->texts.SegmentSizes()) {
    if (!state_->live_texts.contains(segment)) state_->texts.RemoveSegment(segment);
  }
}

Writer::~Writer() = default;

bool Writer::HasRoot() const {
  return Root().document != 0;
}

Entry Writer::Root() const {
  return WithEngine("Cannot read the index", [&] {
    const std::string bytes = state_->database.get_metadata(kRootKey);
    if (bytes.empty()) return Entry{};
    Decoder in(bytes);
    return DecodeEntry(in);
  });
}

void Writer::SetRoot(const Entry& entry) {
  WithEngine("Cannot write the index", [&] {
    Encoder out;
    EncodeEntry(out, entry);
    state_->pending += out.Size();
    state_->database.set_metadata(kRootKey, out.Take());
  });
}

std::vector<Entry> Writer::Entries(DirectoryId directory) const {
  return WithEngine("Cannot read the index", [&] {
    const std::string bytes = state_->database.get_metadata(EntriesKey(directory));
    std::vector<Entry> entries;
    for (Decoder in(bytes); !in.AtEnd();) entries.push_back(DecodeEntry(in));
    return entries;
  });
}

void Writer::SetEntries(DirectoryId directory, const std::vector<Entry>& entries) {
  WithEngine("Cannot write the index", [&] {
    Encoder out;
    for (const Entry& entry : entries) EncodeEntry(out, entry);
    state_->pending += out.Size() + 100;
    state_->database.set_metadata(EntriesKey(directory), out.Take());
  });
}

DirectoryId Writer::AddDirectory(DirectoryId parent, const std::string& name,
                                 const FileRights& rights) {
  const DirectoryId id = state_->table.AddDirectory();
  SetDirectory(id, parent, name, rights);
  return id;
}

void Writer::SetDirectory(DirectoryId id, DirectoryId parent, const std::string& name,
                          const FileRights& rights) {
  state_->table.SetDirectory(id, {parent, state_->table.RightsIdOf(rights), name});
  state_->pending += 100;
}

void Writer::RemoveDirectory(DirectoryId id) {
  WithEngine("Cannot write the index", [&] {
    state_->table.RemoveDirectory(id);
    state_->pending += 100;
    state_->database.set_metadata(EntriesKey(id), {});
  });
}

DocumentId Writer::Add(Prepared prepared) {
  return WithEngine("Cannot write the index", [&] {
    Prepared::Parts& parts = *prepared.parts_;
    state_->Complete(parts);
    if (state_->bulk) return state_->bulk->Add(std::move(parts.engine), parts.size);
    const DocumentId id = state_->database.add_document(parts.engine);
    state_->changes.AddTerms(id);
    return id;
  });
}

void Writer::Replace(DocumentId id, Prepared prepared) {
  WithEngine("Cannot write the index", [&] {
    if (state_->bulk) state_->EndBulk();
    state_->ForgetText(id);
    state_->Complete(*prepared.parts_);
    state_->database.replace_document(id, prepared.parts_->engine);
    state_->changes.AddTerms(id);
  });
}

void Writer::Update(DocumentId id, const Document& document) {
  WithEngine("Cannot write the index", [&] {
    if (state_->bulk) state_->EndBulk();
    Xapian::Document engine = state_->database.get_document(id);
    const Stored stored = Stored::Decode(engine.get_data());
    Document complete = document;
    complete.title = stored.record.title;
    complete.authors = stored.record.authors;
    if (stored.record.name != document.name ||
        state_->table.Rights(stored.place.rights).uid != document.rights.uid) {
      RemoveNameTerms(engine);
      AddNameTerms(engine, complete);
      state_->changes.AddTerms(id);
    }
    state_->changes.AddValues(id);
    state_->Place(engine, complete, stored.text);
    state_->database.replace_document(id, engine);
    state_->pending += 1000;
  });
}

void Writer::Remove(DocumentId id) {
  WithEngine("Cannot write the index", [&] {
    if (state_->bulk) state_->EndBulk();
    state_->ForgetText(id);
    state_->database.delete_document(id);
    state_->changes.AddTerms(id);
    state_->pending += 1000;
  });
}

void Writer::Commit() {
  WithEngine("Cannot commit the index", [&] {
    if (state_->bulk) {
      state_->EndBulk();
    } else if (state_->pending > 0) {
      state_->CommitDatabase();
    }
  });
}

std::size_t Writer::Pending() const {
  return state_->pending;
}

std::uint32_t Writer::Documents() const {
  return WithEngine("Cannot read the index", [&] {
    return state_->bulk ? state_->bulk->Documents() : state_->database.get_doccount();
  });
}

}  // namespace maru::index
