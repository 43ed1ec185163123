#include "filter/media_control.h"

#include "filter/mkv_context.h"

namespace {

constexpr uint32_t kControlError = 1;

int SetState(MkvFilter* filter, uint32_t state) {
  MkvContext* context = filter->Context;
  if (int error = pthread_mutex_lock(&context->StateLock); error != 0) return error;
  StoreControlState(context, state);
  pthread_mutex_unlock(&context->StateLock);
  return 0;
}

}  // namespace

int Start(MkvFilter* filter) { return SetState(filter, kControlRunning); }

int Resume(MkvFilter* filter) { return SetState(filter, kControlResumed); }

int Pause(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  if (int error = pthread_mutex_lock(&context->StateLock); error != 0) return error;
  if (context->ControlState & kControlPausableMask) StoreControlState(context, kControlRunning);
  pthread_mutex_unlock(&context->StateLock);
  return 0;
}

int Status(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  (void)pthread_mutex_lock(&context->StateLock);
  auto state = static_cast<int>(context->ControlState);
  pthread_mutex_unlock(&context->StateLock);
  return state;
}

int Stop(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  if (int error = pthread_mutex_lock(&context->StateLock); error != 0) return error;
  if (context->ControlState == kControlStopped) {
    pthread_mutex_unlock(&context->StateLock);
    return 0;
  }
  int result = context->ControlState == kControlError ? kStopAfterError : 0;
  pthread_mutex_lock(&context->RingLock);
  StoreControlState(context, kControlStopped);
  pthread_cond_broadcast(&context->RingCond);
  pthread_mutex_unlock(&context->RingLock);
  pthread_mutex_unlock(&context->StateLock);
  return result;
}
