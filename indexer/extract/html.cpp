#include <gumbo.h>
#include <strings.h>
#include <sys/mman.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <new>

#include "indexer/extract/charset.h"
#include "indexer/extract/extractor.h"
#include "system/utf8.h"

namespace maru::extract {
namespace {

constexpr std::size_t kMaxHtml = 8u << 20;
constexpr std::size_t kMaxTitle = 1024;
constexpr std::size_t kMaxAuthors = 16;
/// Where a page may say its charset.
constexpr std::size_t kCharsetBytes = 4096;

/// The parser's memory: taken from one block and given back as a whole, so that no tree, however
/// deep, is ever taken down node by node. A page that needs more ends the process.
class Arena {
 public:
  static constexpr std::size_t kSize = 256u << 20;

  Arena() {
    void* block = mmap(nullptr, kSize, PROT_READ | PROT_WRITE,
                       MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
    if (block == MAP_FAILED) throw std::bad_alloc();
    block_ = static_cast<char*>(block);
  }
  ~Arena() { munmap(block_, kSize); }
  Arena(const Arena&) = delete;
  Arena& operator=(const Arena&) = delete;

  void* Take(std::size_t size) {
    size = (size + 15) & ~std::size_t{15};
    if (size > kSize - used_) std::abort();
    used_ += size;
    return block_ + used_ - size;
  }

 private:
  char* block_;
  std::size_t used_ = 0;
};

const GumboOutput& Parse(Arena& arena, const std::string& html) {
  GumboOptions options = kGumboDefaultOptions;
  options.allocator = [](void* memory, std::size_t size) {
    return static_cast<Arena*>(memory)->Take(size);
  };
  options.deallocator = [](void*, void*) {};
  options.userdata = &arena;
  options.max_errors = 0;
  return *gumbo_parse_with_options(&options, html.data(), html.size());
}

/// What separates words and what does not: a <b> in a word leaves it one word.
constexpr std::array kInline = {
    GUMBO_TAG_A,    GUMBO_TAG_ABBR,  GUMBO_TAG_ACRONYM, GUMBO_TAG_B,      GUMBO_TAG_BDI,
    GUMBO_TAG_BDO,  GUMBO_TAG_BIG,   GUMBO_TAG_CITE,    GUMBO_TAG_CODE,   GUMBO_TAG_DEL,
    GUMBO_TAG_DFN,  GUMBO_TAG_EM,    GUMBO_TAG_FONT,    GUMBO_TAG_I,      GUMBO_TAG_INS,
    GUMBO_TAG_KBD,  GUMBO_TAG_MARK,  GUMBO_TAG_Q,       GUMBO_TAG_S,      GUMBO_TAG_SAMP,
    GUMBO_TAG_SPAN, GUMBO_TAG_SMALL, GUMBO_TAG_STRIKE,  GUMBO_TAG_STRONG, GUMBO_TAG_SUB,
    GUMBO_TAG_SUP,  GUMBO_TAG_TT,    GUMBO_TAG_U,       GUMBO_TAG_VAR,    GUMBO_TAG_WBR,
};
constexpr std::array kSilent = {GUMBO_TAG_SCRIPT,   GUMBO_TAG_STYLE,  GUMBO_TAG_TITLE,
                                GUMBO_TAG_NOSCRIPT, GUMBO_TAG_IFRAME, GUMBO_TAG_NOFRAMES};

template <class Tags>
bool Among(const Tags& tags, GumboTag tag) {
  return std::find(tags.begin(), tags.end(), tag) != tags.end();
}

bool IsElement(const GumboNode& node) {
  return node.type == GUMBO_NODE_ELEMENT || node.type == GUMBO_NODE_TEMPLATE;
}

/// Appends text with every run of white space as one blank (or line break, at a block's edge).
class Collector {
 public:
  Collector(std::string& out, std::size_t limit) : out_(out), limit_(limit) {}

  void Break() { gap_ = '\n'; }
  void Add(std::string_view text) {
    for (const char c : text) {
      if (Full()) return;
      if (c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\f') {
        if (gap_ == 0) gap_ = ' ';
        continue;
      }
      if (gap_ != 0 && !out_.empty()) out_ += gap_;
      gap_ = 0;
      out_ += c;
    }
  }
  bool Full() const { return out_.size() > limit_; }

 private:
  std::string& out_;
  std::size_t limit_;
  char gap_ = 0;
};

void TakeTitle(const GumboElement& title, std::string& out) {
  if (!out.empty()) return;
  Collector collector(out, kMaxTitle);
  for (unsigned i = 0; i < title.children.length; ++i) {
    const auto* child = static_cast<const GumboNode*>(title.children.data[i]);
    if (child->type == GUMBO_NODE_TEXT || child->type == GUMBO_NODE_WHITESPACE) {
      collector.Add(child->v.text.text);
    }
  }
  CutUTF8(out, kMaxTitle);
}

void TakeAuthor(const GumboElement& meta, std::vector<std::string>& out) {
  const GumboAttribute* name = gumbo_get_attribute(&meta.attributes, "name");
  const GumboAttribute* content = gumbo_get_attribute(&meta.attributes, "content");
  if (!name || !content || strcasecmp(name->value, "author") != 0) return;
  if (out.size() >= kMaxAuthors) return;
  std::string author;
  Collector(author, kMaxTitle).Add(content->value);
  CutUTF8(author, kMaxTitle);
  if (!author.empty()) out.push_back(std::move(author));
}

/// Walks the tree without recursion.
class Walk {
 public:
  Walk(Extracted& result, std::size_t max_text) : result_(result), text_(result.text, max_text) {}

  void Run(const GumboNode& top) {
    std::vector<std::pair<const GumboNode*, unsigned>> way;
    if (Enter(top)) way.emplace_back(&top, 0);
    while (!way.empty() && !text_.Full()) {
      auto& [node, next] = way.back();
      const GumboNode* child = Child(*node, next++);
      if (!child) {
        Leave(*node);
        way.pop_back();
      } else if (Enter(*child)) {
        way.emplace_back(child, 0);
      }
    }
  }

 private:
  static const GumboNode* Child(const GumboNode& element, unsigned index) {
    const GumboVector& children = element.v.element.children;
    if (index >= children.length) return nullptr;
    return static_cast<const GumboNode*>(children.data[index]);
  }

  /// Whether there is something inside to walk through.
  bool Enter(const GumboNode& node) {
    if (node.type == GUMBO_NODE_TEXT || node.type == GUMBO_NODE_CDATA ||
        node.type == GUMBO_NODE_WHITESPACE) {
      text_.Add(node.v.text.text);
    }
    if (!IsElement(node)) return false;
    const GumboElement& element = node.v.element;
    if (element.tag == GUMBO_TAG_TITLE) TakeTitle(element, result_.title);
    if (element.tag == GUMBO_TAG_META) TakeAuthor(element, result_.authors);
    if (!Among(kInline, element.tag)) text_.Break();
    return node.type == GUMBO_NODE_ELEMENT && !Among(kSilent, element.tag);
  }
  void Leave(const GumboNode& node) {
    if (IsElement(node) && !Among(kInline, node.v.element.tag)) text_.Break();
  }

  Extracted& result_;
  Collector text_;
};

/// The charset a page names in its first bytes: charset=NAME within a tag.
std::string DeclaredCharset(std::string_view html) {
  const std::string_view head = html.substr(0, kCharsetBytes);
  constexpr std::string_view kKey = "charset=";
  const auto same = [](char a, char b) { return std::tolower(static_cast<unsigned char>(a)) == b; };
  const auto at = std::search(head.begin(), head.end(), kKey.begin(), kKey.end(), same);
  std::string name;
  if (at == head.end()) return name;
  for (auto c = at + kKey.size(); c != head.end(); ++c) {
    if (name.empty() && (*c == '"' || *c == '\'' || *c == ' ')) continue;
    if (!std::isalnum(static_cast<unsigned char>(*c)) && *c != '-' && *c != '_') break;
    name += *c;
  }
  return name;
}

}  // namespace

bool IsHtml(std::string_view head) {
  head.remove_prefix(std::min(head.find_first_not_of("\xEF\xBB\xBF \t\r\n"), head.size()));
  const auto begins = [&](std::string_view start) {
    return head.size() >= start.size() && strncasecmp(head.data(), start.data(), start.size()) == 0;
  };
  return begins("<!doctype html") || begins("<html") || begins("<head") || begins("<body");
}

Extracted ExtractHtml(const Source& source) {
  std::string html = ReadStart(source.file, kMaxHtml);
  html = ToUTF8(html, DeclaredCharset(html));
  std::replace(html.begin(), html.end(), '\0', ' ');
  Arena arena;
  Extracted result;
  Walk(result, source.max_text).Run(*Parse(arena, html).root);
  CutUTF8(result.text, source.max_text);
  return result;
}

}  // namespace maru::extract
