#pragma once
// Failure injection for the framework calls whose errors the plug-in must
// answer: a test arms a call, and the next use of it answers the armed error
// without doing anything.

namespace host {

enum class FrameworkCall { kAllocateReadlist, kAcquireReadList, kStreamerSetListMode, kAcquireMra, kCount };

// The next call of `call`, on any thread, answers `error`; 0 disarms it.
void FailNextCall(FrameworkCall call, int error);

// For the host's framework calls: the armed error, taken once, else 0.
int TakeInjectedFailure(FrameworkCall call);

}  // namespace host
