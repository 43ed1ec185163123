#pragma once
// The plug-in's instance handle and channel record: the framework's filter
// handle and channel layouts with the plug-in's own types in its fields.
// Operations receive the framework's records and view them as these.

#include <cstdint>
#include <type_traits>

#include "filter/mkv_channel_state.h"
#include "platform/channel.h"
#include "platform/filter_handle.h"
#include "platform/media_format.h"

struct MkvContext;
struct MkvFilter;

// Bits of MkvChannel::Flags.
constexpr uint32_t kChannelAcquired = 1u << 0;
constexpr uint32_t kChannelMediaOutputSet = 1u << 1;  // input channel only
constexpr uint32_t kChannelFormatSet = 1u << 3;       // output channel only; never cleared
constexpr uint32_t kChannelCreated = 1u << 4;         // set on the input channel by Create

struct MkvChannel {
  uint32_t Kind;  // kMmfChannelKind
  char* Name;     // owned
  uint32_t Direction;
  uint32_t Flags;
  MmfMediaFormat Format;
  MkvFilter* Filter;  // the owning handle
  void* FrameworkLink[2];
  MmfChannel* Peer;   // input channel: the upstream output channel, filled by the framework
  void* FrameworkReserved;
  MkvChannelState* State;  // output channels: owned; null on the input channel
};

struct MkvFilter {
  uint32_t Kind;  // kMmfFilterKind
  char* Name;     // owned, "kelvane<n>"
  MkvChannel* InputChannel;    // owned
  MkvChannel* OutputChannels;  // owned array of OutputChannelCount records; null until rated
  MkvContext* Context;         // owned
  void* FrameworkReserved5;
  MmfGraph* Graph;             // filled by the framework
  void* FrameworkReserved7;
};

static_assert(std::is_standard_layout_v<MkvChannel> && std::is_trivially_copyable_v<MkvChannel>);
static_assert(sizeof(MkvChannel) == sizeof(MmfChannel));
static_assert(__builtin_offsetof(MkvChannel, Format) == __builtin_offsetof(MmfChannel, Format));
static_assert(__builtin_offsetof(MkvChannel, Filter) == __builtin_offsetof(MmfChannel, Filter));
static_assert(__builtin_offsetof(MkvChannel, Peer) == __builtin_offsetof(MmfChannel, Peer));
static_assert(__builtin_offsetof(MkvChannel, State) == __builtin_offsetof(MmfChannel, State));
static_assert(std::is_standard_layout_v<MkvFilter> && std::is_trivially_copyable_v<MkvFilter>);
static_assert(sizeof(MkvFilter) == sizeof(MmfFilterHandle));
static_assert(__builtin_offsetof(MkvFilter, Context) == __builtin_offsetof(MmfFilterHandle, Context));
static_assert(__builtin_offsetof(MkvFilter, Graph) == __builtin_offsetof(MmfFilterHandle, Graph));

// The framework's records seen as the plug-in's (same layout, asserted above).
inline MkvFilter* AsMkvFilter(MmfFilterHandle* handle) { return reinterpret_cast<MkvFilter*>(handle); }
inline MmfFilterHandle* AsFrameworkHandle(MkvFilter* filter) { return reinterpret_cast<MmfFilterHandle*>(filter); }
inline MkvChannel* AsMkvChannel(MmfChannel* channel) { return reinterpret_cast<MkvChannel*>(channel); }
inline MmfChannel* AsFrameworkChannel(MkvChannel* channel) { return reinterpret_cast<MmfChannel*>(channel); }
