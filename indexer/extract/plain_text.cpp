#include "indexer/extract/charset.h"
#include "indexer/extract/extractor.h"

namespace maru::extract {

Extracted ExtractPlainText(const Source& source) {
  Extracted result;
  result.text = ToUtf8(TextPart(ReadStart(source.file, source.max_text)), {});
  CutUtf8(result.text, source.max_text);
  return result;
}

}  // namespace maru::extract
