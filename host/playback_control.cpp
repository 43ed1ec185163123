#include "host/playback_control.h"

#include <chrono>

#include "host/file_streamer.h"
#include "host/graph_clock.h"
#include "platform/mmf_status.h"

namespace host {

namespace {

constexpr auto kPoll = std::chrono::milliseconds(2);

}  // namespace

PlaybackControl::PlaybackControl(const ControlTables& tables, MmfFilterHandle* handle, FileStreamer* streamer,
                                 GraphClock* clock, size_t sinks)
    : tables_(tables), handle_(handle), streamer_(streamer), clock_(clock), sinks_(sinks) {}

// Stop wakes every sink that waits in the ring; once all have parked nothing
// runs inside the plug-in, and the work sees a quiet graph.
template <typename Work>
int PlaybackControl::Sequence(Work work) {
  {
    std::lock_guard lock(mutex_);
    closed_ = true;
  }
  (void)tables_.control->Stop(handle_);
  {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [this] { return parked_ == sinks_; });
  }
  flushed_ = false;
  marked_ = true;
  held_.clear();
  const int result = work();
  (void)tables_.control->Start(handle_);
  {
    std::lock_guard lock(mutex_);
    closed_ = false;
    ++generation_;
    parked_ = 0;  // the parked sinks belong to the sequence just done; they count no more
    idle_ = 0;
    holding_ = 0;
  }
  changed_.notify_all();
  return result;
}

int PlaybackControl::SeekWork(uint64_t time_us) {
  uint64_t position = 0;
  int result = tables_.converter->ConvertToPosition(handle_, 0, time_us, &position);
  if (result != kMmfOk) return result;
  result = tables_.seeker->Seek(handle_, 0, time_us, position);
  (void)streamer_->Seek(position, time_us);
  (void)tables_.flush->Flush(handle_);
  flushed_ = true;
  clock_->Consumed(time_us);
  backward_ = false;
  return result;
}

int PlaybackControl::Seek(uint64_t time_us) {
  return Sequence([&] { return SeekWork(time_us); });
}

bool PlaybackControl::WaitIdle() {
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [this] { return idle_ == sinks_ || finished_; });
  return !finished_;
}

int PlaybackControl::Reposition(uint64_t time_us, const std::vector<bool>& held, const std::function<void()>& prepare) {
  return Sequence([&] {
    marked_ = false;
    held_ = held;
    prepare();
    return SeekWork(time_us);
  });
}

int PlaybackControl::ScanForward(uint32_t speed) {
  return Sequence([&] {
    int result = tables_.trick->ScanForward(handle_, speed);
    (void)tables_.flush->Flush(handle_);
    flushed_ = true;
    backward_ = false;
    return result;
  });
}

int PlaybackControl::ScanBackward(uint32_t speed) {
  return Sequence([&] {
    int result = tables_.trick->ScanBackward(handle_, speed);
    (void)tables_.flush->Flush(handle_);
    flushed_ = true;
    backward_ = true;
    return result;
  });
}

int PlaybackControl::ScanEnd() {
  return Sequence([&] {
    int result = tables_.trick->ScanEnd(handle_);
    (void)tables_.flush->Flush(handle_);
    flushed_ = true;
    backward_ = false;
    return result;
  });
}

int PlaybackControl::ScanWhilePlaying(bool forward, uint32_t speed) {
  return forward ? tables_.trick->ScanForward(handle_, speed) : tables_.trick->ScanBackward(handle_, speed);
}

int PlaybackControl::Pause() { return tables_.control->Pause(handle_); }

int PlaybackControl::Resume() { return tables_.control->Resume(handle_); }

int PlaybackControl::Stop() {
  int result = tables_.control->Stop(handle_);
  Finish();
  return result;
}

bool PlaybackControl::Due(const ControlAction& action) {
  // A held sink may keep another waiting for room in the ring: its time has come.
  if (idle_ == sinks_ || holding_ > 0) return true;
  const uint64_t now = clock_->Now();
  return backward_ ? now <= action.at_us : now >= action.at_us;
}

bool PlaybackControl::WaitUntil(const std::function<bool()>& reached) {
  std::unique_lock lock(mutex_);
  while (!reached()) {
    if (idle_ == sinks_) return false;
    changed_.wait_for(lock, kPoll);
  }
  return true;
}

std::vector<int> PlaybackControl::Run(const std::vector<ControlAction>& actions) {
  std::vector<int> results;
  for (const ControlAction& action : actions) {
    {
      std::unique_lock lock(mutex_);
      pending_at_ = action.at_us;
      while (!Due(action)) changed_.wait_for(lock, kPoll);
      pending_at_ = UINT64_MAX;
    }
    switch (action.kind) {
      case ControlAction::kSeek:
        results.push_back(Seek(action.time_us));
        break;
      case ControlAction::kScanForward:
        results.push_back(ScanForward(action.speed));
        break;
      case ControlAction::kScanBackward:
        results.push_back(ScanBackward(action.speed));
        break;
      case ControlAction::kScanEnd:
        results.push_back(ScanEnd());
        break;
    }
  }
  return results;
}

void PlaybackControl::Finish() {
  {
    std::lock_guard lock(mutex_);
    finished_ = true;
  }
  changed_.notify_all();
}

bool PlaybackControl::Checkpoint() {
  if (!closed_.load(std::memory_order_relaxed)) return false;
  std::unique_lock lock(mutex_);
  if (!closed_) return false;
  const uint64_t generation = generation_;
  ++parked_;
  changed_.notify_all();
  changed_.wait(lock, [&] { return generation_ != generation; });
  return true;
}

bool PlaybackControl::AfterEnd(size_t sink) {
  std::unique_lock lock(mutex_);
  for (;;) {
    const uint64_t generation = generation_;
    ++parked_;
    ++idle_;
    changed_.notify_all();
    changed_.wait(lock, [&] { return generation_ != generation || finished_; });
    if (generation_ == generation) break;
    if (sink >= held_.size() || !held_[sink]) return true;
  }
  --parked_;
  --idle_;
  return false;
}

bool PlaybackControl::Flushed() {
  std::lock_guard lock(mutex_);
  return flushed_;
}

bool PlaybackControl::Marked() {
  std::lock_guard lock(mutex_);
  return marked_;
}

bool PlaybackControl::Consumed(uint64_t time_us) {
  clock_->Consumed(time_us);
  std::unique_lock lock(mutex_);
  if (backward_ || time_us < pending_at_) return false;
  const uint64_t generation = generation_;
  ++parked_;
  ++holding_;
  changed_.notify_all();
  changed_.wait(lock, [&] { return generation_ != generation; });
  return true;
}

}  // namespace host
