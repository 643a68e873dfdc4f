#include "indexer/extract/charset.h"

#include <iconv.h>
#include <uchardet/uchardet.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <map>
#include <memory>

#include "system/text.h"
#include "system/utf8.h"

namespace maru::extract {
namespace {

/// Bytes that statistics look at.
constexpr std::size_t kGuessBytes = 64u << 10;
constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

/// Charsets that are converted from, by the converter's names.
constexpr std::array kCharsets = {
    "UTF-16LE",     "UTF-16BE",     "UTF-32LE",
    "UTF-32BE",     "WINDOWS-1252", "ISO-8859-2",
    "ISO-8859-3",   "ISO-8859-4",   "ISO-8859-5",
    "ISO-8859-6",   "ISO-8859-7",   "ISO-8859-8",
    "ISO-8859-10",  "ISO-8859-13",  "ISO-8859-15",
    "ISO-8859-16",  "WINDOWS-1250", "WINDOWS-1251",
    "WINDOWS-1253", "WINDOWS-1254", "WINDOWS-1255",
    "WINDOWS-1256", "WINDOWS-1257", "WINDOWS-1258",
    "KOI8-R",       "KOI8-U",       "IBM852",
    "IBM855",       "IBM862",       "IBM865",
    "IBM866",       "MAC-CYRILLIC", "MAC-CENTRALEUROPE",
    "VISCII",       "EUC-JP",       "ISO-2022-JP",
    "UHC",          "ISO-2022-KR",  "EUC-TW",
    "GB18030",
};
/// Those that a larger one holds, with that one's converter.
constexpr std::pair<const char*, const char*> kHeld[] = {
    {"ISO-8859-1", "WINDOWS-1252"},
    {"LATIN1", "WINDOWS-1252"},
    {"ISO-8859-9", "WINDOWS-1254"},
    {"ISO-8859-11", "CP874"},
    {"TIS-620", "CP874"},
    {"SHIFT_JIS", "CP932"},
    {"EUC-KR", "UHC"},
    {"BIG5", "BIG5-HKSCS"},
    {"GB2312", "GB18030"},
    {"GBK", "GB18030"},
};

struct Mark {
  std::string_view bytes;
  const char* charset;  // null: UTF-8
};
/// Longer ones before those they begin with.
constexpr std::array kMarks = {
    Mark{{"\xEF\xBB\xBF", 3}, nullptr},    Mark{{"\xFF\xFE\0\0", 4}, "UTF-32LE"},
    Mark{{"\0\0\xFE\xFF", 4}, "UTF-32BE"}, Mark{{"\xFF\xFE", 2}, "UTF-16LE"},
    Mark{{"\xFE\xFF", 2}, "UTF-16BE"},
};

const Mark* FindMark(std::string_view bytes) {
  for (const Mark& mark : kMarks) {
    if (bytes.starts_with(mark.bytes)) return &mark;
  }
  return nullptr;
}

bool IsWide(std::string_view bytes) {
  const Mark* mark = FindMark(bytes);
  return mark && mark->charset;
}

const char* ConverterOf(std::string_view charset) {
  for (const auto& [name, converter] : kHeld) {
    if (SameWord(name, charset)) return converter;
  }
  for (const char* name : kCharsets) {
    if (SameWord(name, charset)) return name;
  }
  return nullptr;
}

/// The open converter, or null when this machine has none. They stay open for good.
iconv_t* Converter(const std::string& name) {
  static auto* const open = new std::map<std::string, iconv_t>;
  auto place = open->find(name);
  if (place == open->end()) {
    place = open->emplace(name, iconv_open("UTF-8", name.c_str())).first;
  }
  return place->second == reinterpret_cast<iconv_t>(-1) ? nullptr : &place->second;
}

std::string Guess(std::string_view bytes) {
  const auto first = std::find_if(bytes.begin(), bytes.end(),
                                  [](char c) { return static_cast<unsigned char>(c) >= 0x80; });
  const std::string_view sample =
      bytes.substr(static_cast<std::size_t>(first - bytes.begin())).substr(0, kGuessBytes);
  const std::unique_ptr<uchardet, void (*)(uchardet_t)> detector(uchardet_new(), uchardet_delete);
  if (uchardet_handle_data(detector.get(), sample.data(), sample.size()) != 0) return {};
  uchardet_data_end(detector.get());
  return uchardet_get_charset(detector.get());
}

std::string Convert(iconv_t converter, std::string_view bytes) {
  iconv(converter, nullptr, nullptr, nullptr, nullptr);
  std::string text;
  std::array<char, 16384> buffer;
  char* in = const_cast<char*>(bytes.data());
  std::size_t in_left = bytes.size();
  while (in_left > 0) {
    char* out = buffer.data();
    std::size_t out_left = buffer.size();
    const std::size_t done = iconv(converter, &in, &in_left, &out, &out_left);
    text.append(buffer.data(), buffer.size() - out_left);
    if (done != static_cast<std::size_t>(-1) || errno == E2BIG) continue;
    if (errno == EINVAL) break;
    text += kReplacement;
    ++in;
    --in_left;
  }
  return text;
}

}  // namespace

bool IsBinary(std::string_view head) {
  if (IsWide(head)) return false;
  std::size_t controls = 0;
  for (const char c : head) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte == 0) return true;
    const bool usual = (byte >= '\b' && byte <= '\r') || byte == 0x1b;
    if ((byte < 0x20 && !usual) || byte == 0x7f) ++controls;
  }
  return controls > head.size() / 32;
}

std::string_view TextPart(std::string_view bytes) {
  return IsWide(bytes) ? bytes : bytes.substr(0, bytes.find('\0'));
}

std::optional<std::string_view> UTF8Text(std::string_view bytes) {
  const Mark* mark = FindMark(bytes);
  if (mark && !mark->charset) bytes.remove_prefix(mark->bytes.size());
  const std::size_t length = UTF8Beginning(bytes);
  if (length < bytes.size() && !IsCutUTF8(bytes.substr(length))) return std::nullopt;
  return bytes.substr(0, length);
}

std::string RepairUTF8(std::string_view bytes) {
  std::string text;
  bool replaced = false;
  while (!bytes.empty()) {
    const std::size_t good = UTF8Beginning(bytes);
    text += bytes.substr(0, good);
    bytes.remove_prefix(good);
    if (good > 0) replaced = false;
    if (bytes.empty()) break;
    if (!replaced) text += kReplacement;
    replaced = true;
    bytes.remove_prefix(1);
  }
  return text;
}

void LoadCharsets() {
  const auto load = [](const char* name) {
    if (iconv_t* converter = Converter(name)) Convert(*converter, "a");
  };
  for (const char* name : kCharsets) load(name);
  for (const auto& [name, converter] : kHeld) load(converter);
}

std::string ToUTF8(std::string_view bytes, std::string_view declared) {
  if (const auto text = UTF8Text(bytes)) return std::string(*text);
  const Mark* mark = FindMark(bytes);
  if (mark) bytes.remove_prefix(mark->bytes.size());
  const bool wide = mark && mark->charset;
  const char* name = wide ? mark->charset : mark ? nullptr : ConverterOf(declared);
  if (!name && !mark && !SameWord(declared, "UTF-8")) {
    const std::string guess = Guess(bytes);
    if (!SameWord(guess, "UTF-8")) name = ConverterOf(guess);
    if (!name && !SameWord(guess, "UTF-8")) name = "WINDOWS-1252";
  }
  iconv_t* converter = name ? Converter(name) : nullptr;
  return converter ? Convert(*converter, bytes) : RepairUTF8(bytes);
}

}  // namespace maru::extract
