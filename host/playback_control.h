#pragma once
// The framework's control of a running parser graph: seeks and trick play
// done to the plug-in, the streamer and the sinks in the framework's order.
// Every sequence first stops the filter (which wakes every sink waiting for
// room in the ring) and waits until each sink has parked, then works on a
// quiet graph and starts it again:
//  - seek to T: ConvertToPosition(T), Seek(T, position), the streamer moved to
//    the position with a time marker of T, Flush; the clock reads T;
//  - fast forward / rewind: ScanForward / ScanBackward (the streamer goes to
//    list mode), Flush; ScanEnd: ScanEnd (back to normal streaming), Flush.
// The graph clock follows the media time of the frames the sinks consume, so
// a scan starts from "now".

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>
#include <vector>

#include "platform/interfaces.h"

namespace host {

class FileStreamer;
class GraphClock;

struct ControlAction {
  enum Kind { kSeek, kScanForward, kScanBackward, kScanEnd };
  Kind kind = kSeek;
  uint64_t at_us = 0;    // when the clock has reached this media time (or every sink is idle)
  uint64_t time_us = 0;  // kSeek: where to
  uint32_t speed = 0;    // scans
};

struct ControlTables {
  const MmfMediaControlOps* control = nullptr;
  const MmfMediaFlushOps* flush = nullptr;
  const MmfTimeConverterOps* converter = nullptr;
  const MmfSeekerOps* seeker = nullptr;
  const MmfTrickPlayOps* trick = nullptr;
};

class PlaybackControl {
 public:
  PlaybackControl(const ControlTables& tables, MmfFilterHandle* handle, FileStreamer* streamer, GraphClock* clock,
                  size_t sinks);

  // The controller's side. Each answers the plug-in's first failing answer
  // (a refused seek leaves the stream where it was), or 0.
  int Seek(uint64_t time_us);
  int ScanForward(uint32_t speed);
  int ScanBackward(uint32_t speed);
  int ScanEnd();
  int Pause();
  int Resume();
  int Stop();
  // A scan started while the channels play, as a framework's other thread may
  // start one: no Stop and no flush; the filter switches the streamer itself.
  int ScanWhilePlaying(bool forward, uint32_t speed);
  // Runs the actions in order, each when its time has come; their answers in order.
  std::vector<int> Run(const std::vector<ControlAction>& actions);
  // Waits until `reached` answers true (true) or every sink has ended (false).
  // `reached` is asked every few milliseconds.
  bool WaitUntil(const std::function<bool()>& reached);
  // No sequence follows: sinks that have ended may finish.
  void Finish();

  // The runner's own sequences, once a channel has failed. WaitIdle blocks
  // until every sink waits in AfterEnd (true) or Finish came (false; a script
  // that stopped the graph). Reposition seeks as Seek does, after
  // `prepare` has run on the quiet graph; the sinks marked in `held` stay
  // parked, and the others do not count it as a seek (Marked).
  bool WaitIdle();
  int Reposition(uint64_t time_us, const std::vector<bool>& held, const std::function<void()>& prepare);

  // The sinks' side. Before each NextBuffer: parks while a sequence runs;
  // true when one ran meanwhile.
  bool Checkpoint();
  // After NextBuffer answered anything but a delivery: waits for the next
  // sequence that does not hold sink `sink` (true: go on pulling) or for
  // Finish (false: the sink ends). After each true answer of these three the
  // sink asks Flushed and Marked.
  bool AfterEnd(size_t sink);
  // Whether the last sequence flushed the filter (a refused seek does not):
  // only then is a frame being put together lost.
  bool Flushed();
  // Whether the last sequence was the controller's (a seek or a scan) rather than a Reposition.
  bool Marked();
  // A sink consumed frames up to this media time. While Run waits for an
  // action whose time this reaches, the sink parks until the action is done
  // (true), so playback
  // never runs past the point an action was asked for.
  bool Consumed(uint64_t time_us);

 private:
  template <typename Work>
  int Sequence(Work work);
  int SeekWork(uint64_t time_us);
  bool Due(const ControlAction& action);

  ControlTables tables_;
  MmfFilterHandle* handle_;
  FileStreamer* streamer_;
  GraphClock* clock_;

  std::mutex mutex_;
  std::condition_variable changed_;
  const size_t sinks_;
  // A sequence runs: sinks park at their next checkpoint. Written under
  // mutex_; read without it first, so that a checkpoint costs no lock.
  std::atomic<bool> closed_{false};
  bool finished_ = false;
  uint64_t generation_ = 0;  // sequences completed
  // Sinks that parked (in Checkpoint or AfterEnd) since the last sequence
  // ended, and of those the ones waiting in AfterEnd; a sequence's end zeroes
  // both, so a sink woken but not yet running is never taken for parked.
  size_t parked_ = 0;
  size_t idle_ = 0;
  size_t holding_ = 0;  // of those, the ones held in Consumed at a pending action's time
  bool backward_ = false;    // a backward scan is on: actions are due as the clock falls
  uint64_t pending_at_ = UINT64_MAX;  // Run's next action waits for this time; UINT64_MAX: none
  bool flushed_ = false;  // written by a sequence's work while every sink is parked
  bool marked_ = true;    // likewise
  std::vector<bool> held_;  // sinks that the last sequence leaves parked
};

}  // namespace host
