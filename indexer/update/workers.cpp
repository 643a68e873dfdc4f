#include "indexer/update/workers.h"

#include <malloc.h>

#include <algorithm>
#include <exception>
#include <utility>

#include "indexer/extract/charset.h"
#include "indexer/extract/extractor.h"
#include "system/log.h"

namespace maru::indexer {
namespace {

constexpr std::size_t kMaxUnderWay = 128;
/// Bytes of files under way in a lane, beside one large one. Prepared, each becomes ten or more
/// where all words differ.
constexpr std::size_t kMaxCost = 2u << 20;
constexpr std::size_t kNameCost = 4u << 10;

/// Bytes read between two times that free memory is given back: what one thread allocates and
/// another frees leaves holes that would double the process.
constexpr std::uint64_t kTrimEvery = 16u << 20;

/// A text that the index refuses costs the file its text only.
index::Prepared Prepare(index::Document document, bool& failed) {
  std::string text = std::exchange(document.text, {});
  index::Document without_text = document;
  without_text.title.clear();
  without_text.authors.clear();
  document.text = std::move(text);
  try {
    return index::Prepared(std::move(document));
  } catch (const std::exception& error) {
    MARU_LOG("Indexed by name only: %s: %s", without_text.name.c_str(), error.what());
    failed = true;
    return index::Prepared(std::move(without_text));
  }
}

}  // namespace

Workers::Workers(extract::Processes& processes, std::size_t max_text)
    : processes_(processes), max_text_(max_text) {
  for (unsigned slot = 0; slot < processes.Slots(); ++slot) {
    threads_.emplace_back([this, slot](const std::stop_token& closing) { Run(closing, slot); });
  }
}

void Workers::Run(const std::stop_token& closing, unsigned slot) {
  while (true) {
    std::unique_lock lock(mutex_);
    if (!work_.wait(lock, closing, [this] { return !queue_.empty(); })) return;
    Item item = std::move(queue_.front());
    queue_.pop_front();
    lock.unlock();
    item.lane->Deliver(Work(slot, std::move(item.job)));
  }
}

void Workers::Submit(Lane& lane, Job job) {
  {
    const std::lock_guard lock(mutex_);
    queue_.push_back({&lane, std::move(job)});
  }
  work_.notify_one();
}

Result Workers::Work(unsigned slot, Job job) {
  bool failed = false;
  std::uint64_t bytes_read = 0;
  if (job.file) {
    try {
      failed = !TakeText(slot, job, bytes_read);
    } catch (const std::exception&) {
      failed = true;
    }
    job.file = UniqueFd();
  }
  std::string name = job.document.name;
  index::Prepared prepared = Prepare(std::move(job.document), failed);
  return {std::move(job), std::move(name), std::move(prepared), failed, bytes_read};
}

bool Workers::TakeText(unsigned slot, Job& job, std::uint64_t& bytes_read) {
  const int file = job.file.Get();
  std::string bytes = extract::ReadStart(file, extract::kHeadBytes);
  bytes_read = bytes.size();
  const std::size_t row = extract::ChooseExtractor(job.document.name, bytes);
  if (row == extract::kNoExtractor) return true;
  if (row == extract::PlainTextRow()) {
    // UTF-8 needs no understanding: to look through its bytes here spares most files the way over.
    if (bytes.size() == extract::kHeadBytes) bytes = extract::ReadStart(file, max_text_);
    bytes_read = bytes.size();
    if (const auto text = extract::UTF8Text(extract::TextPart(bytes))) {
      bytes.erase(0, static_cast<std::size_t>(text->data() - bytes.data())).resize(text->size());
      job.document.text = std::move(bytes);
      return true;
    }
  }
  bytes = {};
  std::optional<extract::Extracted> extracted = processes_.Extract(slot, row, file, max_text_);
  if (!extracted) return false;
  bytes_read = std::max<std::uint64_t>(bytes_read, job.document.size);
  job.document.title = std::move(extracted->title);
  job.document.authors = std::move(extracted->authors);
  job.document.text = std::move(extracted->text);
  return true;
}

Lane::~Lane() {
  while (Take(true)) continue;
}

void Lane::Submit(Job job) {
  while (!HasRoom()) Put(*Take(true));
  const std::uint64_t text =
      job.file ? std::min<std::uint64_t>(job.document.size, workers_.MaxText()) : 0;
  job.cost = kNameCost + static_cast<std::size_t>(text);
  ++under_way_;
  cost_ += job.cost;
  workers_.Submit(*this, std::move(job));
}

void Lane::Collect() {
  while (std::optional<Result> result = Take(false)) Put(std::move(*result));
}

void Lane::Finish() {
  while (std::optional<Result> result = Take(true)) Put(std::move(*result));
}

void Lane::Deliver(Result result) {
  const std::lock_guard lock(mutex_);
  results_.push_back(std::move(result));
  // Within the lock: the lane may be gone as soon as its owner has seen the result.
  finished_.notify_one();
}

bool Lane::HasRoom() const {
  return under_way_ == 0 || (under_way_ < kMaxUnderWay && cost_ < kMaxCost);
}

std::optional<Result> Lane::Take(bool wait) {
  if (under_way_ == 0) return std::nullopt;
  std::unique_lock lock(mutex_);
  if (wait) finished_.wait(lock, [this] { return !results_.empty(); });
  if (results_.empty()) return std::nullopt;
  Result result = std::move(results_.front());
  results_.pop_front();
  --under_way_;
  cost_ -= result.job.cost;
  return result;
}

void Lane::Put(Result result) {
  Counts& counts = tree_.Counted();
  if (result.failed) ++counts.failed;
  const std::uint64_t before = counts.bytes.fetch_add(result.bytes_read);
  if (before / kTrimEvery != counts.bytes / kTrimEvery) malloc_trim(0);
  Folder& folder = *result.job.folder;
  index::Entry* entry = folder.Find(result.name);
  if (!entry) {
    tree_.AddFile(folder, std::move(result.prepared), result.name, result.job.stamp);
  } else if (entry->directory == 0) {
    tree_.ReplaceFile(folder, *entry, std::move(result.prepared), result.job.stamp);
  }
  tree_.CommitIfDue();
}

}  // namespace maru::indexer
