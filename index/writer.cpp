#include "index/writer.h"

#include <stdlib.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <map>

#include "index/codec.h"
#include "index/directories.h"
#include "index/engine.h"
#include "index/fields.h"
#include "index/prepared.h"
#include "index/texts.h"

namespace maru::index {
namespace {

Xapian::WritableDatabase OpenDatabase(const std::string& path) {
  // Left alone, the engine commits by itself after so many documents; here only Commit does.
  setenv("XAPIAN_FLUSH_THRESHOLD", "100000000", 1);
  if (mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) {
    throw maruseeker::Error(maruseeker::kErrorDaemonExchange,
                            "Cannot make " + path + ": " + std::strerror(errno));
  }
  return WithEngine("Cannot open the index", [&] {
    const int flags = Xapian::DB_CREATE_OR_OPEN | Xapian::DB_BACKEND_GLASS;
    Xapian::WritableDatabase database(path + kDatabaseFolder, flags);
    const std::string format = database.get_metadata(kFormatKey);
    if (format == kFormat) return database;
    if (!format.empty() || database.get_doccount() > 0) {
      database.close();
      for (const auto& entry : std::filesystem::directory_iterator(path)) {
        std::filesystem::remove_all(entry.path());
      }
      database = Xapian::WritableDatabase(path + kDatabaseFolder, flags);
    }
    database.set_metadata(kFormatKey, kFormat);
    return database;
  });
}

}  // namespace

struct Writer::State {
  explicit State(const std::string& path)
      : folder(path), database(OpenDatabase(path)), texts(path) {
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
    index::Place place{document.parent, table.ConditionOf(document.rights),
                       KindNumber(KindOf(document))};
    engine.add_value(kPlaceSlot, place.Encode());
    StoredRecord stored{{document.name, document.is_dir, document.size, document.mtime,
                         document.title, document.authors},
                        text};
    engine.add_value(kRecordSlot, stored.Encode());
    engine.add_value(static_cast<Xapian::valueno>(FindField(kSize)->slot),
                     Xapian::sortable_serialise(static_cast<double>(document.size)));
    engine.add_value(static_cast<Xapian::valueno>(FindField(kModTime)->slot),
                     Xapian::sortable_serialise(static_cast<double>(document.mtime)));
  }

  void Complete(Prepared::Parts& parts) {
    const TextPlace text = texts.Append(parts.packed_text);
    live_texts[text.segment] += text.length;
    Place(parts.engine, parts.document, text);
    pending += parts.size;
  }

  void ForgetText(DocumentId id) {
    const StoredRecord stored =
        StoredRecord::Decode(database.get_document(id).get_value(kRecordSlot));
    std::uint64_t& live = live_texts[stored.text.segment];
    live -= std::min(live, stored.text.length);
  }

  void SweepTexts();
  void CopyTexts(const std::vector<std::uint32_t>& segments);

  std::string folder;
  Xapian::WritableDatabase database;
  TextWriter texts;
  DirectoryTable table;
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
  for (auto value = database.valuestream_begin(kRecordSlot);
       value != database.valuestream_end(kRecordSlot); ++value) {
    const StoredRecord stored = StoredRecord::Decode(*value);
    if (stored.text.length > 0 &&
        std::find(segments.begin(), segments.end(), stored.text.segment) != segments.end()) {
      documents.push_back(value.get_docid());
    }
  }
  for (const DocumentId id : documents) {
    Xapian::Document engine = database.get_document(id);
    StoredRecord stored = StoredRecord::Decode(engine.get_value(kRecordSlot));
    stored.text = texts.Append(reader.ReadPacked(stored.text));
    live_texts[stored.text.segment] += stored.text.length;
    engine.add_value(kRecordSlot, stored.Encode());
    database.replace_document(id, engine);
  }
  for (const std::uint32_t segment : segments) live_texts.erase(segment);
}

Writer::Writer(const std::string& path) : state_(std::make_unique<State>(path)) {
  WithEngine("Cannot tidy the index", [&] { state_->SweepTexts(); });
  if (state_->table.Commit() == 0) state_->pending = 1;
  Commit();
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
  const ConditionId condition = state_->table.ConditionOf(rights);
  state_->table.SetDirectory(id, {parent, condition, name});
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
    state_->Complete(*prepared.parts_);
    return state_->database.add_document(prepared.parts_->engine);
  });
}

void Writer::Replace(DocumentId id, Prepared prepared) {
  WithEngine("Cannot write the index", [&] {
    state_->ForgetText(id);
    state_->Complete(*prepared.parts_);
    state_->database.replace_document(id, prepared.parts_->engine);
  });
}

void Writer::Update(DocumentId id, const Document& document) {
  WithEngine("Cannot write the index", [&] {
    Xapian::Document engine = state_->database.get_document(id);
    const StoredRecord stored = StoredRecord::Decode(engine.get_value(kRecordSlot));
    const Place place = Place::Decode(engine.get_value(kPlaceSlot));
    Document complete = document;
    complete.title = stored.record.title;
    complete.authors = stored.record.authors;
    if (stored.record.name != document.name ||
        state_->table.Condition(place.condition).uid != document.rights.uid) {
      RemoveNameTerms(engine);
      AddNameTerms(engine, complete);
    }
    state_->Place(engine, complete, stored.text);
    state_->database.replace_document(id, engine);
    state_->pending += 1000;
  });
}

void Writer::Remove(DocumentId id) {
  WithEngine("Cannot write the index", [&] {
    state_->ForgetText(id);
    state_->database.delete_document(id);
    state_->pending += 1000;
  });
}

void Writer::Commit() {
  WithEngine("Cannot commit the index", [&] {
    State& state = *state_;
    if (state.pending == 0) return;
    state.texts.Sync();
    state.table.Save([&](const std::string& key, const std::string& value) {
      state.database.set_metadata(key, value);
    });
    Encoder live;
    for (const auto& [segment, bytes] : state.live_texts) live.Number(segment).Number(bytes);
    state.database.set_metadata(kTextsKey, live.Take());
    state.database.commit();
    state.pending = 0;
  });
}

std::size_t Writer::Pending() const {
  return state_->pending;
}

std::uint32_t Writer::Documents() const {
  return WithEngine("Cannot read the index", [&] { return state_->database.get_doccount(); });
}

}  // namespace maru::index
