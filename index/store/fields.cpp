#include "index/store/fields.h"

#include <array>

namespace maru::index {
namespace {

constexpr std::array kFields = {
    Field{kPath, FieldType::kPath, "", -1, 0},
    Field{kName, FieldType::kText, "XN", -1, 4},
    Field{kExtension, FieldType::kKeyword, "XE", -1, 0},
    Field{kIsDir, FieldType::kFlag, "XD", -1, 0},
    Field{kSize, FieldType::kNumber, "", 2, 0},
    Field{kText, FieldType::kText, "", -1, 1},
    Field{kOwner, FieldType::kKeyword, "XU", -1, 0},
    Field{kModTime, FieldType::kTime, "", 3, 0},
    Field{kKind, FieldType::kKeyword, "XK", -1, 0},
    Field{kTitle, FieldType::kText, "XS", -1, 3},
    Field{kAuthors, FieldType::kText, "XA", -1, 2},
};

struct KindRow {
  std::string_view kind;
  std::string_view extensions;  // each between blanks
};

constexpr std::array kKindRows = {
    KindRow{
        "document",
        " docx wri rtf pptx pps ppsx pdf txt text doc ppt odt odp odg odc odf odb odi odm ott otp "
        "otg otc oti oth potx pptm ppsm potm dotx dot pot ppa docm dotm eml msg xla xlb xlc xld "
        "xlk "
        "xll xlm xlt xlv xlw xls xlsx xlsm xlsb xltm xlam xltx ods ots csv tsv tex md markdown rst "
        "htm html xhtml log conf ini cfg srt sub epub mobi azw3 pdb chm lit ps "},
    KindRow{
        "code",
        " c cc cpp cxx h hh hpp hxx cs css sass scss js mjs ts json lisp el scm ocaml ml mli pl pm "
        "py rb rs go java kt scala r ada adb ads coffee sh bash zsh lua php sql swift vim yaml yml "
        "toml xml cmake mk awk asm s "},
    KindRow{"audio",
            " aac ac3 aif aiff ape cue dff dsf flac m3u m4a m4b m4p mp1 mp2 mp3 mpa ogg oga opus "
            "pcm pls "
            "ra ram wav wma wpl mid midi "},
    KindRow{
        "video",
        " 3g2 3gp asf avi divx dvr-ms f4v flv ifo m2t m2ts m4v mkv mov mp4 mpeg mpg mts qt rm rmvb "
        "swf tp trp vdr vob webm wmv xvid "},
    KindRow{"image",
            " 3fr arw bmp cr2 crw dcr dng erf gif heic heif ico jpe jpeg jpg k25 kdc mef mos mrw "
            "nef orf "
            "pef png psd ptx raf raw rw2 sr2 srf svg tif tiff ufo webp x3f xcf "},
    KindRow{"archive", " zip tar gz tgz bz2 tbz xz txz zst 7z rar deb rpm iso jar lz lzma cpio "},
};

static_assert(kKindRows.size() + 2 == kKinds, "folder and other come behind the table");

}  // namespace

std::span<const Field> Fields() {
  return kFields;
}

const Field* FindField(std::string_view name) {
  for (const Field& field : kFields) {
    if (field.name == name) return &field;
  }
  return nullptr;
}

std::string_view KindOfExtension(std::string_view extension) {
  if (extension.empty() || extension.find(' ') != std::string_view::npos) return "other";
  const std::string word = " " + std::string(extension) + " ";
  for (const KindRow& row : kKindRows) {
    if (row.extensions.find(word) != std::string_view::npos) return row.kind;
  }
  return "other";
}

bool IsKind(std::string_view kind) {
  return KindNumber(kind) < kKinds;
}

std::uint8_t KindNumber(std::string_view kind) {
  std::uint8_t number = 0;
  for (const KindRow& row : kKindRows) {
    if (row.kind == kind) return number;
    ++number;
  }
  return kind == "folder" ? number : kind == "other" ? number + 1 : kKinds;
}

std::string ExtensionOf(std::string_view name) {
  const auto dot = name.rfind('.');
  std::string extension;
  if (dot == std::string_view::npos) return extension;
  for (const char c : name.substr(dot + 1)) {
    extension += c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
  }
  return extension;
}

}  // namespace maru::index
