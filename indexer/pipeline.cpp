#include "indexer/pipeline.h"

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

/// A text that the index refuses costs the file its text only.
index::Prepared Prepare(index::Document document, bool& failed) {
  index::Document without_text = document;
  without_text.title.clear();
  without_text.authors.clear();
  without_text.text.clear();
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
    threads_.emplace_back([this, slot] { Run(slot); });
  }
}

Workers::~Workers() {
  {
    const std::lock_guard lock(mutex_);
    closing_ = true;
  }
  work_.notify_all();
  for (std::thread& thread : threads_) thread.join();
}

void Workers::Run(unsigned slot) {
  while (true) {
    std::unique_lock lock(mutex_);
    work_.wait(lock, [this] { return closing_ || !queue_.empty(); });
    if (queue_.empty()) return;
    Item item = std::move(queue_.front());
    queue_.pop_front();
    lock.unlock();
    const std::size_t cost = item.lane->Cost(item.job);
    Result result = Work(slot, std::move(item.job));
    result.cost = cost;
    item.lane->Finish(std::move(result));
  }
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
  return {.folder = job.folder,
          .name = std::move(name),
          .stamp = job.stamp,
          .prepared = Prepare(std::move(job.document), failed),
          .failed = failed,
          .bytes_read = bytes_read};
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
    bytes.resize(extract::TextPart(bytes).size());
    if (extract::IsUtf8(bytes)) {
      bytes.resize(extract::Utf8Length(bytes));
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

std::size_t Lane::Cost(const Job& job) const {
  if (!job.file) return kNameCost;
  return kNameCost +
         static_cast<std::size_t>(std::min<std::uint64_t>(job.document.size, workers_.max_text_));
}

bool Lane::HasRoom() const {
  if (under_way_ == 0) return true;
  return under_way_ < kMaxUnderWay && cost_ < kMaxCost;
}

void Lane::Submit(Job job) {
  ++under_way_;
  cost_ += Cost(job);
  {
    const std::lock_guard lock(workers_.mutex_);
    workers_.queue_.push_back({this, std::move(job)});
  }
  workers_.work_.notify_one();
}

void Lane::Finish(Result result) {
  const std::lock_guard lock(mutex_);
  results_.push_back(std::move(result));
  // Within the lock: the lane may be gone as soon as its owner has seen the result.
  finished_.notify_one();
}

std::optional<Result> Lane::Take(bool wait) {
  if (under_way_ == 0) return std::nullopt;
  std::unique_lock lock(mutex_);
  if (wait) finished_.wait(lock, [this] { return !results_.empty(); });
  if (results_.empty()) return std::nullopt;
  Result result = std::move(results_.front());
  results_.pop_front();
  --under_way_;
  cost_ -= result.cost;
  return result;
}

}  // namespace maru::indexer
