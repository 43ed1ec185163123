#pragma once
// Status numbers of the framework that filter operations answer. They are
// fixed values, whatever the host's own error numbering.

enum {
  kMmfOk = 0,
  kMmfReadOnly = 1,            // a resource that cannot be set; also a generic error
  kMmfEndOfStream = 2,         // NextBuffer: the stream has ended; not a control state, so it sticks
  kMmfFormatMatch = 100,       // a format is offered or verified
  kMmfBufferDelivered = 256,   // NextBuffer handed out a media buffer
  kMmfInvalidArgument = 22,
  kMmfRatingAccepted = 80,
  kMmfRatingRefused = 0,
  kMmfNoConversion = 4002,        // time or position cannot be converted
  kMmfChannelNotAcquired = 4009,  // input channel operations
  kMmfMediaOutputSet = 4011,
  kMmfMediaOutputNotSet = 4012,
  kMmfAlreadyAcquired = 4013,
  kMmfOutputNotAcquired = 4014,
  kMmfNotAcquired = 4015,
  kMmfFormatAlreadySet = 4016,
  kMmfFormatNotSet = 4017,
  kMmfUnknownResource = 4032,
  kMmfStoppedAfterError = 4041,
  kMmfNotAvailable = 4044,        // the thing asked for does not exist (yet)
};
