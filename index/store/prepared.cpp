#include "index/store/prepared.h"

#include "index/store/engine.h"
#include "index/store/fields.h"
#include "index/store/texts.h"
#include "index/text/term_counts.h"
#include "index/text/tokenizer.h"

namespace maru::index {
namespace {

/// Longest exact value that becomes a term; the engine takes 245 bytes.
constexpr std::size_t kMaxValue = 64;

std::string_view PrefixOf(std::string_view field) {
  return FindField(field)->prefix;
}

void AddWords(Xapian::Document& engine, std::string_view prefix, std::string_view text,
              Xapian::termpos& position) {
  std::string term(prefix);
  Tokenizer().ForEach(text, [&](const Token& token) {
    term.replace(prefix.size(), std::string::npos, token.word);
    engine.add_posting(term, ++position);
    return true;
  });
}

void AddValue(Xapian::Document& engine, std::string_view field, std::string_view value) {
  if (!value.empty() && value.size() <= kMaxValue) {
    engine.add_boolean_term(TermOf(PrefixOf(field), value));
  }
}

std::string AddText(Xapian::Document& engine, std::string_view text) {
  thread_local TermCounts counts;
  counts.Clear();
  TextPacker packer(text);
  // A character of a script without spaces that the word before was.
  std::string before;
  Tokenizer().ForEach(text, [&](const Token& token) {
    const std::uint64_t hash = HashWord(token.word);
    packer.AddWord(hash, token.begin);
    counts.Add(hash, token.word);
    const bool spaceless = IsSpacelessWord(token.word);
    if (spaceless && !before.empty()) {
      before += token.word;
      counts.Add(HashWord(before), before);
    }
    before.assign(spaceless ? token.word : std::string_view());
    return true;
  });
  counts.ForEach([&](std::string_view word, std::uint32_t count) {
    engine.add_term(std::string(word), count);
  });
  return packer.Finish();
}

}  // namespace

std::string_view KindOf(const Document& document) {
  return document.is_dir ? "folder" : KindOfExtension(ExtensionOf(document.name));
}

void AddNameTerms(Xapian::Document& engine, const Document& document) {
  const std::string_view prefix = PrefixOf(kName);
  Xapian::termpos position = 0;
  AddWords(engine, prefix, document.name, position);
  const std::vector<std::string> words = WordsOfName(document.name);
  for (std::size_t i = position; i < words.size(); ++i) engine.add_term(TermOf(prefix, words[i]));
  if (!document.is_dir) AddValue(engine, kExtension, ExtensionOf(document.name));
  if (document.is_dir) AddValue(engine, kIsDir, "1");
  AddValue(engine, kKind, KindOf(document));
  AddValue(engine, kOwner, std::to_string(document.rights.uid));
}

void RemoveNameTerms(Xapian::Document& engine) {
  for (const std::string_view field : {kName, kExtension, kIsDir, kKind, kOwner}) {
    const std::string prefix(PrefixOf(field));
    std::vector<std::string> terms;
    auto term = engine.termlist_begin();
    for (term.skip_to(prefix); term != engine.termlist_end() && (*term).starts_with(prefix);
         ++term) {
      terms.push_back(*term);
    }
    for (const std::string& old : terms) engine.remove_term(old);
  }
}

Prepared::Prepared(Document document) : parts_(std::make_unique<Parts>()) {
  WithEngine("Cannot prepare a document", [&] {
    AddNameTerms(parts_->engine, document);
    Xapian::termpos position = 0;
    AddWords(parts_->engine, PrefixOf(kTitle), document.title, position);
    position = 0;
    for (const std::string& author : document.authors) {
      AddWords(parts_->engine, PrefixOf(kAuthors), author, position);
      // Phrases do not reach from one author into the next.
      position += 100;
    }
    parts_->packed_text = AddText(parts_->engine, document.text);
  });
  // What a document's terms cost the engine while they wait to be written, by measurement.
  parts_->size = 2000 + document.text.size() * 3 + parts_->packed_text.size();
  document.text = {};
  parts_->document = std::move(document);
}

Prepared::~Prepared() = default;
Prepared::Prepared(Prepared&&) noexcept = default;
Prepared& Prepared::operator=(Prepared&&) noexcept = default;

std::size_t Prepared::Size() const {
  return parts_->size;
}

}  // namespace maru::index
