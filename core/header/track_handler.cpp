#include <cstring>
#include <initializer_list>

#include "core/header/ebml_read.h"
#include "core/header/element_handlers.h"
#include "core/header/track_elements.h"
#include "core/memory.h"
#include "core/status.h"
#include "platform/ao_log.h"

namespace {

constexpr uint64_t kMaxBinarySize = 32768;
constexpr uint64_t kVideoTrack = 1;
constexpr uint64_t kAudioTrack = 2;

// The record being filled and the content-encoding record that encoding
// children land in (null until a ContentEncoding opens one).
struct track_entry {
  mkv_file_info* info;
  mkvvstream* stream;
  mkv_track_info* track;
  mkv_content_encoding* open_encoding;
};

int read_error(int status, int line) {
  AoLog(kAoLogNotice, "Error Reading at line %d", line);
  return status;
}

void start_track_record(mkv_track_info* track) {
  std::memset(track, 0, sizeof *track);
  track->track_timecode_scale = 1.0;
  track->flag_enabled = 1;
  track->flag_default = 1;
  track->flag_lacing = 1;
  track->sampling_frequency = 8000.0;
  track->channels = 1;
}

// A record that is not counted is invisible to destroy_mkv_file_info, so its
// buffers are released here.
void abandon_track_record(mkv_track_info* track) {
  free_mkv_track_info(track);
  std::memset(track, 0, sizeof *track);
}

int read_integer(mkvvstream* stream, uint64_t size, uint64_t* field) {
  int status = ebml_read_uint(stream, size, field);
  return status == kStatusOk ? kStatusOk : read_error(status, __LINE__);
}

int read_flag(mkvvstream* stream, uint64_t size, uint8_t* field) {
  uint64_t value = 0;
  int status = ebml_read_uint(stream, size, &value);
  if (status != kStatusOk) return read_error(status, __LINE__);
  *field = static_cast<uint8_t>(value & 1);
  return kStatusOk;
}

int read_real(mkvvstream* stream, uint64_t size, double* field) {
  int status = ebml_read_float(stream, size, field);
  return status == kStatusOk ? kStatusOk : read_error(status, __LINE__);
}

// A repeated element replaces the earlier value, so the earlier block goes first.
int read_text(const track_entry& entry, uint64_t size, char** field) {
  mem_free(*field);
  int status = ebml_read_string(entry.stream, size, string_limit(entry.info), field);
  return status == kStatusOk ? kStatusOk : read_error(status, __LINE__);
}

// Unlike other strings, the bound counts the terminator too.
int read_codec_id(const track_entry& entry, uint64_t size) {
  char** field = &entry.track->codec_id;
  mem_free(*field);
  *field = nullptr;
  uint64_t limit = string_limit(entry.info);
  if (size >= limit || size > UINT32_MAX - 2) return read_error(kStatusNoMemory, __LINE__);
  if (!ebml_payload_fits(entry.stream, size)) return read_error(kStatusReadFailed, __LINE__);
  auto* text = static_cast<char*>(mem_alloc_zeroed(static_cast<size_t>(size) + 2));
  if (!text) return read_error(kStatusNoMemory, __LINE__);
  *field = text;
  if (ebml_read_exact(entry.stream, text, static_cast<uint32_t>(size)) != kStatusOk) {
    return read_error(kStatusReadFailed, __LINE__);
  }
  text[static_cast<size_t>(size)] = '\0';
  return kStatusOk;
}

// An empty payload still gets a block of its own, so "present but empty" does
// not depend on what the heap answers to a zero-byte request.
int read_payload(mkvvstream* stream, uint64_t size, uint8_t** data, uint32_t* count) {
  mem_free(*data);
  *data = nullptr;
  if (size > kMaxBinarySize) return read_error(kStatusNoMemory, __LINE__);
  auto* payload = static_cast<uint8_t*>(mem_alloc(size == 0 ? 1 : static_cast<size_t>(size)));
  if (!payload) return read_error(kStatusNoMemory, __LINE__);
  *data = payload;
  *count = static_cast<uint32_t>(size);
  if (ebml_read_exact(stream, payload, static_cast<uint32_t>(size)) != kStatusOk) {
    return read_error(kStatusReadFailed, __LINE__);
  }
  return kStatusOk;
}

void open_content_encoding(track_entry& entry) {
  mkv_track_info* track = entry.track;
  if (track->content_encoding_count >= kMaxContentEncodings) {
    // Encodings beyond the fifth all update the fifth record.
    entry.open_encoding = &track->content_encodings[kMaxContentEncodings - 1];
    return;
  }
  entry.open_encoding = &track->content_encodings[track->content_encoding_count++];
  entry.open_encoding->scope = 1;
}

// Nothing is checked: an unreadable target shows as the entry's end.
void skip_element(mkvvstream* stream, uint64_t size) { (void)ebml_skip(stream, size); }

int read_child(track_entry& entry, uint32_t id, uint64_t size) {
  const track_element_rule* row = find_track_element_rule(id);
  if (!row) {
    skip_element(entry.stream, size);
    return kStatusOk;
  }
  mkv_track_info* track = entry.track;
  mkvvstream* stream = entry.stream;
  switch (row->rule) {
    case track_rule::integer: return read_integer(stream, size, &(track->*row->field.integer));
    case track_rule::flag: return read_flag(stream, size, &(track->*row->field.flag));
    case track_rule::real: return read_real(stream, size, &(track->*row->field.real));
    case track_rule::text: return read_text(entry, size, &(track->*row->field.text));
    case track_rule::codec_id: return read_codec_id(entry, size);
    case track_rule::codec_private:
      return read_payload(stream, size, &track->codec_private, &track->codec_private_size);
    case track_rule::track_type: {
      int status = read_integer(stream, size, &track->track_type);
      if (status != kStatusOk) return status;
      if (track->track_type == kVideoTrack) ++entry.info->video_track_count;
      if (track->track_type == kAudioTrack) ++entry.info->audio_track_count;
      return kStatusOk;
    }
    case track_rule::colour_space:
      if (size != 4) {
        skip_element(stream, size);
        return kStatusOk;
      }
      return read_integer(stream, size, &track->colour_space);
    case track_rule::descend: return kStatusOk;
    case track_rule::open_encoding: open_content_encoding(entry); return kStatusOk;
    case track_rule::compression: track->compressed = 1; return kStatusOk;
    case track_rule::encryption: track->encrypted = 1; return kStatusOk;
    case track_rule::encoding_integer:
      if (!entry.open_encoding) break;
      return read_integer(stream, size, &(entry.open_encoding->*row->field.encoding_integer));
    case track_rule::encoding_binary: {
      if (!entry.open_encoding) break;
      const encoding_payload_field& field = row->field.encoding_binary;
      return read_payload(stream, size, &(entry.open_encoding->*field.data), &(entry.open_encoding->*field.size));
    }
  }
  skip_element(stream, size);
  return kStatusOk;
}

}  // namespace

int mkv_track_handler(mkv_file_info* info, mkvvstream* stream, uint32_t*, uint64_t* size) {
  if (info->track_count >= kMaxTracks) {
    AoLog(kAoLogFailure, "mkv_track_handler:  File contains too many tracks.");
    return kStatusNoMemory;
  }
  uint64_t end = ebml_end_of(mkvvstream_tell(stream), *size);
  track_entry entry{info, stream, &info->tracks[info->track_count], nullptr};
  start_track_record(entry.track);
  info->parse_flags |= kMetTrackEntry;

  // Masters that descend are transparent: their children are read here as the
  // entry's own, bounded by the entry's end, not by the master's size.
  while (mkvvstream_tell(stream) < end) {
    uint32_t id = 0;
    uint64_t child_size = 0;
    // An entry cut short by the end of the stream or by a byte that starts no
    // element is complete with what was read so far.
    if (ebml_read_id(stream, &id) != kStatusOk || ebml_read_size(stream, &child_size) != kStatusOk) break;
    int status = read_child(entry, id, child_size);
    if (status != kStatusOk) {
      abandon_track_record(entry.track);
      return status;
    }
  }
  ++info->track_count;
  return kStatusOk;
}
