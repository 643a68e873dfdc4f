#include "indexer/extract/charset.h"
#include "indexer/extract/extractor.h"
#include "system/utf8.h"

namespace maru::extract {

Extracted ExtractPlainText(const Source& source) {
  Extracted result;
  result.text = ToUTF8(TextPart(ReadStart(source.file, source.max_text)), {});
  CutUTF8(result.text, source.max_text);
  return result;
}

}  // namespace maru::extract
