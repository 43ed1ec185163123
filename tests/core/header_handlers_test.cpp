// The handlers of Info, TrackEntry, SeekHead, Cues and Tags over crafted
// element payloads, called the way the walker calls them. What real files
// hold is compared with the tools' view in the fixture test; here are the
// values those files do not exercise, the limits and the failures.

#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>
#include <string>
#include <tuple>
#include <type_traits>
#include <vector>

#include "core/header/element_handlers.h"
#include "core/status.h"
#include "host/heap_control.h"
#include "platform/ao_log.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;
using testing_support::HeaderParseOptions;
using testing_support::LogRecorder;

std::string text(const char* s) { return s ? s : "-"; }
template <typename T>
std::string n(T value) { return std::to_string(value); }

// Fields that differ from the record's defaults, as "name value", or "defaults".
struct Fields {
  std::string out;
  template <typename T>
  Fields& add(const char* name, T value, std::type_identity_t<T> fallback) {
    if (value != fallback) out += (out.empty() ? "" : " ") + std::string(name) + " " + format(value);
    return *this;
  }
  static std::string format(const char* s) { return s; }
  static std::string format(char* s) { return s; }
  static std::string format(const std::string& s) { return s; }
  static std::string format(double v) {
    char buffer[32];
    std::snprintf(buffer, sizeof buffer, "%.15g", v);
    return buffer;
  }
  template <typename T>
  static std::string format(T v) { return std::to_string(v); }
  std::string done() const { return out.empty() ? "defaults" : out; }
};

std::string info_of(const mkv_file_info& i) {
  char* none = nullptr;
  return Fields{}
      .add("scale", i.timecode_scale, uint64_t{1000000})
      .add("duration", i.duration, 0.0)
      .add("date", i.date_utc, int64_t{0})
      .add("uid", n(i.segment_uid[0]) + ".." + n(i.segment_uid[15]), std::string("0..0"))
      .add("title", i.title, none)
      .add("file", i.segment_filename, none)
      .add("unmet", !(i.parse_flags & kMetInfo), false)
      .done();
}

// The first track: number, channels, width, names, sizes, flags and the
// encodings as order/scope/settings size (k: a key ID).
std::string track_of(const mkv_file_info& i) {
  if (i.track_count == 0) return "none";
  const mkv_track_info& t = i.tracks[0];
  char* none = nullptr;
  Fields f;
  f.add("number", t.track_number, uint64_t{0}).add("channels", t.channels, uint64_t{1}).add("width", t.pixel_width, uint64_t{0});
  f.add("name", t.name, none).add("codec", t.codec_id ? std::strlen(t.codec_id) : 0, size_t{0});
  f.add("private", t.codec_private_size, uint32_t{0}).add("enc", t.encrypted, decltype(t.encrypted){0});
  f.add("comp", t.compressed, decltype(t.compressed){0});
  for (uint32_t e = 0; e < t.content_encoding_count; ++e) {
    const mkv_content_encoding& c = t.content_encodings[e];
    f.out += " " + n(c.order) + "/" + n(c.scope) + "/" + n(c.comp_settings_size) + (c.enc_key_id ? "k" : "");
  }
  return f.done();
}

// List 0 as id@position in list order; the count and the flag.
std::string seeks_of(const mkv_file_info& i) {
  std::string out;
  mkv_queue_node* node = i.seek_lists[0].head;
  for (uint32_t k = 0; k < i.seek_lists[0].count; ++k, node = node->next) {
    const auto* entry = static_cast<const mkv_seek_entry*>(node->data);
    char id[16];
    std::snprintf(id, sizeof id, "%X", entry->seek_id);
    out += std::string(id) + "@" + n(entry->seek_position) + " ";
  }
  return out + "heads " + n(i.seek_head_count) + ((i.parse_flags & kMetSeekHead) ? " met" : "");
}

// "time:track/cluster/block/state[ref,ref];track/..." per point, "|" between
// points; the Cues flag; the Info flag set beforehand must stay.
std::string cues_of(const mkv_file_info& i) {
  std::string out;
  mkv_queue_node* point_node = i.cue_points.head;
  for (uint32_t p = 0; p < i.cue_points.count; ++p, point_node = point_node->next) {
    const auto* point = static_cast<const mkv_cue_point*>(point_node->data);
    out += (p ? "|" : "") + n(point->cue_time) + ":";
    mkv_queue_node* node = point->track_positions.head;
    for (uint32_t t = 0; t < point->track_positions.count; ++t, node = node->next) {
      const auto* position = static_cast<const mkv_cue_track_position*>(node->data);
      out += (t ? ";" : "") + n(position->cue_track) + "/" + n(position->cue_cluster_position) + "/" +
             n(position->cue_block_number) + "/" + n(position->cue_codec_state) + "[";
      mkv_queue_node* ref = position->references.head;
      for (uint32_t r = 0; r < position->references.count; ++r, ref = ref->next) {
        out += (r ? "," : "") + n(static_cast<const mkv_cue_reference*>(ref->data)->cue_ref_time);
      }
      out += "]";
    }
  }
  return out + ((i.parse_flags & kMetCues) ? " met" : "") + ((i.parse_flags & kMetInfo) ? "" : " info lost");
}

// Each entry as "name=string/binary/length", null fields as "-"; the first
// two and the last when there are more.
std::string tags_of(const mkv_file_info& i) {
  std::string out = n(i.tag_count);
  for (uint32_t k = 0; k < i.tag_count; ++k) {
    if (k >= 2 && k + 1 < i.tag_count) continue;
    const mkv_tag_entry& tag = i.tags[k];
    out += " " + text(tag.name) + "=" + text(tag.string) + "/" +
           (tag.binary ? std::string(reinterpret_cast<const char*>(tag.binary), tag.length) : "-") + "/" + n(tag.length);
  }
  return out;
}

struct Kind {
  int (*handler)(mkv_file_info*, mkvvstream*, uint32_t*, uint64_t*);
  uint32_t id;
  std::string (*describe)(const mkv_file_info&);
};
const Kind kInfoH{mkv_info_handler, kInfo, info_of}, kTrackH{mkv_track_handler, kTrackEntry, track_of},
    kSeekH{mkv_meta_seek_handler, kSeekHead, seeks_of}, kCueH{mkv_cue_handler, kCues, cues_of},
    kTagH{mkv_tag_handler, kTags, tags_of};

// The handler over `payload` as one element's data whose header claims
// `claimed` more bytes than the file holds.
int RunHandler(HeaderParse& parse, const Kind& kind, const Bytes& payload, int64_t claimed = 0) {
  uint32_t id = kind.id;
  uint64_t size = payload.size() + static_cast<uint64_t>(claimed);
  return kind.handler(&parse.info(), &parse.stream(), &id, &size);
}

Bytes seek(uint32_t target, uint64_t position) {
  return master(kSeek, {element(kSeekId, id_bytes(target)), uinteger(kSeekPosition, position)});
}
Bytes point(uint64_t time, const Bytes& positions) { return master(kCuePoint, {uinteger(kCueTime, time), positions}); }
Bytes position(uint64_t track, uint64_t cluster, const Bytes& more = {}) {
  return master(kCueTrackPositions, {uinteger(kCueTrack, track), uinteger(kCueClusterPosition, cluster), more});
}
Bytes ref(uint64_t time) { return master(kCueReference, {uinteger(kCueRefTime, time)}); }
Bytes simple_tag(std::string_view name, std::string_view value) {
  return master(kSimpleTag, {str(kTagName, name), str(kTagString, value)});
}
// An element header announcing `announced` bytes of which `present` follow.
Bytes cut(uint32_t id, uint64_t announced, size_t present) { return cat({id_bytes(id), size_bytes(announced), filler(present, 0x41)}); }
Bytes many_tags(int count) {
  Bytes out;
  for (int i = 0; i < count; ++i) out = cat({out, simple_tag("T" + n(i), "v" + n(i))});
  return out;
}
// Buffers a track already holds when a later child fails must go with it.
Bytes held() { return cat({str(kName, "held"), bin(kCodecPrivate, {1, 2, 3}), master(kContentEncoding, {bin(kContentCompSettings, {7})})}); }
Bytes encodings(uint64_t first, uint64_t last) {
  Bytes out;
  for (uint64_t order = first; order <= last; ++order) {
    out = cat({out, master(kContentEncoding, {uinteger(kContentEncodingOrder, order),
                                              master(kContentCompression, {bin(kContentCompSettings, {0x0F})})})});
  }
  return element(kContentEncodings, out);
}

const char* const kReadError = "Error Reading at line *";

TEST(HeaderHandlersTest, StoreWhatTheElementHoldsOrFailWithTheirStatus) {
  const struct {
    const char* name;
    const Kind& kind;
    Bytes payload;
    int status;
    std::string want;
    int64_t claimed = 0;
    bool with_limits = true;
    const char* message = nullptr;  // logged at notice level (a trailing '*' matches any rest); Tags: else nothing
  } cases[] = {
      // Info: values as encoded; a wrong size fails the element.
      {"Info: nothing", kInfoH, {}, kStatusOk, "defaults"},
      {"Info: TimecodeScale of length 0", kInfoH, element(kTimecodeScale, {}), kStatusOk, "scale 0"},
      {"Info: Duration as single", kInfoH, element(kDuration, {0x45, 0xFA, 0x00, 0x00}), kStatusOk, "duration 8000"},
      {"Info: DateUTC of one byte 0xFF", kInfoH, element(kDateUtc, {0xFF}), kStatusOk, "date -1"},
      {"Info: DateUTC of eight bytes", kInfoH, sinteger(kDateUtc, -1234567890123, 8), kStatusOk, "date -1234567890123"},
      {"Info: UID, filename and a later Title", kInfoH,
       cat({bin(kSegmentUid, {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16}), str(kTitle, "A"), str(kSegmentFilename, "f.mkv"), str(kTitle, "B")}),
       kStatusOk, "uid 1..16 title B file f.mkv"},
      {"Info: UID of 15 bytes", kInfoH, bin(kSegmentUid, filler(15)), kStatusMalformed, ""},
      {"Info: Duration of 2 bytes", kInfoH, element(kDuration, {0x45, 0xFA}), kStatusMalformed, ""},
      {"Info: DateUTC of 9 bytes", kInfoH, element(kDateUtc, filler(9, 1)), kStatusMalformed, ""},

      // TrackEntry: a bad or cut child fails the entry and frees it; an early end keeps what was read.
      {"Track: integer of 9 bytes", kTrackH, cat({held(), element(kTrackNumber, filler(9, 1))}), kStatusMalformed, "none", 64, true, kReadError},
      {"Track: float of 2 bytes", kTrackH, cat({held(), element(kTrackTimecodeScale, {0x3F, 0x00})}), kStatusMalformed, "none", 64, true, kReadError},
      {"Track: string cut short", kTrackH, cat({held(), cut(kCodecName, 20, 3)}), kStatusReadFailed, "none", 64, true, kReadError},
      {"Track: codec ID cut short", kTrackH, cat({held(), cut(kCodecId, 20, 3)}), kStatusReadFailed, "none", 64, true, kReadError},
      {"Track: encoding payload cut short", kTrackH, cat({held(), cut(kContentSigKeyId, 9, 1)}), kStatusReadFailed, "none", 64, true, kReadError},
      {"Track: ID byte 0x0F ends the entry", kTrackH, cat({uinteger(kTrackNumber, 5), Bytes{0x0F, 0x81, 0x00}, uinteger(kChannels, 6)}), kStatusOk,
       "number 5"},
      {"Track: entry ends before the next child", kTrackH, cat({uinteger(kTrackNumber, 5), uinteger(kChannels, 6)}), kStatusOk, "number 5", -3},
      {"Track: Name at the limit", kTrackH, str(kName, std::string(8192, 'n')), kStatusOk, "name " + std::string(8192, 'n')},
      {"Track: Name past the limit", kTrackH, str(kName, std::string(8193, 'n')), kStatusNoMemory, "none"},
      {"Track: CodecID one below the limit", kTrackH, str(kCodecId, std::string(8191, 'V')), kStatusOk, "codec 8191"},
      {"Track: CodecID at the limit", kTrackH, str(kCodecId, std::string(8192, 'V')), kStatusNoMemory, "none"},
      {"Track: CodecPrivate at the bound", kTrackH, bin(kCodecPrivate, filler(32768, 3)), kStatusOk, "private 32768"},
      {"Track: CodecPrivate past the bound, no limits", kTrackH, bin(kCodecPrivate, filler(32769, 3)), kStatusNoMemory, "none", 0, false},
      // Masters are read as the entry's own children: the Video master claims
      // one byte, an encoding child before any encoding is dropped, and the
      // sixth encoding updates the fifth.
      {"Track: masters and encodings", kTrackH,
       cat({uinteger(kContentEncodingOrder, 7), bin(kContentEncKeyId, {1}), master_sized(kVideo, 1, {uinteger(kPixelWidth, 640)}),
            master(kContentEncodings, {master(kContentEncoding, {uinteger(kContentEncodingScope, 2), master(kContentEncryption, {})})}),
            encodings(10, 15)}),
       kStatusOk, "width 640 enc 1 comp 1 0/2/0 10/1/1 11/1/1 12/1/1 15/1/1"},

      // SeekHead: entries sorted by position keeping file order of ties; a
      // SeekHead without a Seek is not counted; a damaged one is dropped and
      // a value that cannot be read fails it.
      {"Seek: sorted by position, ties in file order", kSeekH, cat({seek(kTags, 70), seek(kCues, 70), seek(kInfo, 9), seek(kTracks, 70)}), kStatusOk,
       "1549A966@9 1254C367@70 1C53BB6B@70 1654AE6B@70 heads 1 met"},
      {"Seek: position over 32 bits", kSeekH, seek(kCues, 12345678901ull), kStatusOk, "1C53BB6B@12345678901 heads 1 met"},
      {"Seek: no SeekPosition is the segment's start", kSeekH, cat({seek(kTags, 4), master(kSeek, {element(kSeekId, id_bytes(kCues))})}),
       kStatusOk, "1C53BB6B@0 1254C367@4 heads 1 met"},
      {"Seek: one-byte stored ID", kSeekH, seek(kVoid, 8), kStatusOk, "EC@8 heads 1 met"},
      {"Seek: unknown children and a Void", kSeekH, cat({bin(kVoid, filler(3)), master(kSeek, {bin(0x4321, filler(2)), seek(kInfo, 6)})}),
       kStatusOk, "0@0 1549A966@6 heads 1 met"},
      {"Seek: empty", kSeekH, {}, kStatusOk, "heads 0"},
      {"Seek: malformed child ID", kSeekH, cat({seek(kInfo, 1), Bytes{0x00, 0x81, 0x00}, seek(kCues, 2)}), kStatusOk, "heads 0"},
      {"Seek: stored ID of five bytes", kSeekH, cat({seek(kInfo, 1), master(kSeek, {element(kSeekId, Bytes{0x08, 1, 2, 3, 4})})}),
       kStatusOk, "heads 0"},
      {"Seek: SeekPosition of 9 bytes", kSeekH,
       cat({seek(kInfo, 1), master(kSeek, {element(kSeekId, id_bytes(kCues)), element(kSeekPosition, filler(9))})}), kStatusMalformed, "heads 0"},
      {"Seek: short SeekPosition", kSeekH,
       cat({seek(kInfo, 1), id_bytes(kSeek), size_bytes(7), id_bytes(kSeekPosition), size_bytes(4), Bytes{1, 2}}), kStatusReadFailed, "heads 0"},

      // Cues: file order; a new CuePoint keeps the track position created
      // last, so a stray CueTrack lands there; children before their master
      // have no record to fill.
      {"Cues: CueBlockNumber", kCueH, point(7, position(2, 99, uinteger(kCueBlockNumber, 12))), kStatusOk, "7:2/99/12/0[] met"},
      {"Cues: two positions, references and a CodecState", kCueH,
       point(5, cat({position(1, 10, cat({ref(4), master(kCueReference, {uinteger(kCueRefTime, 6), uinteger(0x97, 1)})})),
                     position(2, 10, uinteger(kCueCodecState, 3))})),
       kStatusOk, "5:1/10/1/0[4,6];2/10/1/3[] met"},
      {"Cues: file order", kCueH, cat({point(30, position(1, 300)), point(10, position(1, 100))}), kStatusOk, "30:1/300/1/0[]|10:1/100/1/0[] met"},
      {"Cues: 64-bit values", kCueH, point(0xFFFFFFFFFFFFFFFFull, position(1, 0x123456789Aull)), kStatusOk,
       "18446744073709551615:1/78187493530/1/0[] met"},
      {"Cues: orphans before the first CuePoint", kCueH,
       cat({uinteger(kCueTime, 8), uinteger(kCueTrack, 3), master(kCueTrackPositions, {uinteger(kCueTrack, 4)}), ref(2), point(1, position(1, 2))}),
       kStatusOk, "1:1/2/1/0[] met"},
      {"Cues: current position survives a new CuePoint", kCueH,
       cat({point(1, position(1, 2)), element(kCuePoint, {}), uinteger(kCueTrack, 9)}), kStatusOk, "1:9/2/1/0[]|0: met"},
      {"Cues: empty", kCueH, {}, kStatusOk, ""},
      {"Cues: first CueTime of 9 bytes", kCueH, element(kCuePoint, element(kCueTime, filler(9))), kStatusMalformed, "0: met"},
      {"Cues: malformed header after a point", kCueH, cat({point(1, position(1, 2)), Bytes{0xBB, 0x00}}), kStatusMalformed, "1:1/2/1/0[] met"},
      {"Cues: value cut by the end of the file", kCueH, cat({id_bytes(kCuePoint), size_bytes(5), id_bytes(kCueTime), size_bytes(4), Bytes{1}}),
       kStatusReadFailed, "0: met", 16},

      // Tags: each SimpleTag fills the next entry; the first name and string stand.
      {"Tags: nested SimpleTag gets its own entry and stays current", kTagH,
       master(kSimpleTag, {str(kTagName, "A"), simple_tag("B", "bb"), str(kTagString, "late")}), kStatusOk, "2 A=-/-/0 B=bb/-/2"},
      {"Tags: first name and string stand", kTagH,
       master(kSimpleTag, {str(kTagName, "A"), str(kTagName, "B"), str(kTagString, "1"), str(kTagString, "22")}), kStatusOk, "1 A=1/-/1"},
      {"Tags: binary counts its bytes", kTagH, master(kSimpleTag, {str(kTagName, "C"), bin(kTagBinary, {'p', 'n', 'g', 0, 1})}), kStatusOk,
       std::string("1 C=-/png") + '\0' + "\x01/5"},
      {"Tags: length is the value read last", kTagH, master(kSimpleTag, {str(kTagString, "four"), bin(kTagBinary, {'b', 'i'})}), kStatusOk,
       "1 -=four/bi/2"},
      {"Tags: values before any SimpleTag are skipped", kTagH, cat({str(kTagName, "X"), str(kTagString, "Y"), simple_tag("T", "v")}),
       kStatusOk, "1 T=v/-/1"},
      {"Tags: name of 8193", kTagH, master(kSimpleTag, {str(kTagName, std::string(8193, 'n'))}), kStatusNoMemory, "", 0, true,
       "Error allocating tag name of size 8193"},
      {"Tags: name of 8193 without limits", kTagH, master(kSimpleTag, {str(kTagName, std::string(8193, 'n'))}), kStatusOk,
       "1 " + std::string(8193, 'n') + "=-/-/0", 0, false},
      {"Tags: string of 8193", kTagH, master(kSimpleTag, {str(kTagString, std::string(8193, 's'))}), kStatusNoMemory, "", 0, true,
       "Error allocating tag string of size 8193"},
      {"Tags: binary of 32768", kTagH, master(kSimpleTag, {bin(kTagBinary, filler(32768, 'b'))}), kStatusOk,
       "1 -=-/" + std::string(32768, 'b') + "/32768", 0, false},
      {"Tags: binary of 32769", kTagH, master(kSimpleTag, {bin(kTagBinary, filler(32769))}), kStatusNoMemory, "", 0, false,
       "Error allocating tag binary of size 32769"},
      {"Tags: string claiming 2^32 bytes", kTagH, cat({id_bytes(kSimpleTag), size_bytes(20), id_bytes(kTagString), size_bytes(1ull << 32)}),
       kStatusNoMemory, "", 0, false, "Error allocating tag string of size 4294967296"},
      {"Tags: string cut by the end of the file", kTagH, cat({id_bytes(kSimpleTag), size_bytes(40), id_bytes(kTagString), size_bytes(10), Bytes{'a', 'b', 'c'}}),
       kStatusReadFailed, "", 7},
      {"Tags: the fifty-first is logged and dropped", kTagH, many_tags(51), kStatusOk, "50 T0=v0/-/2 T1=v1/-/2 T49=v49/-/3", 0, true,
       "kelvane:  Too many tags.  Some metadata may be missing."},
  };
  for (const auto& c : cases) {
    int64_t live = host::LiveBlockCount();
    {
      LogRecorder log;
      // Bytes behind the element, except where a read must meet the end of the file.
      bool trailer = c.status == kStatusOk && c.claimed <= 0;
      HeaderParse parse(trailer ? cat({c.payload, filler(8)}) : c.payload, HeaderParseOptions{.with_limits = c.with_limits});
      parse.info().parse_flags = c.kind.id == kCues ? kMetInfo : 0;
      EXPECT_EQ(RunHandler(parse, c.kind, c.payload, c.claimed), c.status) << c.name;
      if (!c.want.empty() || c.kind.id == kCues) {
        EXPECT_EQ(c.kind.describe(parse.info()), c.want) << c.name;
      }
      if (trailer && (c.kind.id == kSeekHead || c.kind.id == kTags)) {
        EXPECT_EQ(mkvvstream_tell(&parse.stream()), c.payload.size()) << c.name << ": not at the element's end";
      }
      const mkv_tag_entry& tag = parse.info().tags[0];
      if (c.kind.id == kTags && c.status == kStatusNoMemory) {
        EXPECT_TRUE(!tag.name && !tag.string && !tag.binary) << c.name;
      }
      if (c.kind.id == kTags && c.status == kStatusReadFailed) {
        EXPECT_LE(tag.length, 3u) << c.name << ": more than arrived";
      }
      std::string message = c.message ? c.message : "";
      bool logged = false;
      for (const auto& [level, t] : log.messages()) {
        logged |= level == kAoLogNotice && (message.ends_with('*') ? t.starts_with(message.substr(0, message.size() - 1)) : t == message);
      }
      EXPECT_EQ(c.message ? logged : !log.messages().empty() && c.kind.id == kTags, c.message != nullptr) << c.name;
    }
    EXPECT_EQ(host::LiveBlockCount(), live) << c.name;
  }
}

// How a TrackEntry's children are read where it is not "the value as
// encoded": flags keep their lowest bit, a ColourSpace other than four bytes
// is skipped, a later Name replaces the first, and an unknown master is not
// descended into.
TEST(HeaderHandlersTest, TrackChildrenReadByTheirOwnRules) {
  Bytes children = cat({uinteger(kFlagLacing, 2), uinteger(kFlagForced, 3), element(kTrackTimecodeScale, {0x3F, 0x00, 0x00, 0x00}),
                        str(kName, "first"), str(kName, "Commentary"),
                        master(kVideo, {uinteger(kColourSpace, 0x49343230, 4), uinteger(kColourSpace, 0x5959, 2)}),
                        element(0x55B0, uinteger(kTrackNumber, 99)), uinteger(kTrackNumber, 2)});
  HeaderParse parse(children);
  ASSERT_EQ(RunHandler(parse, kTrackH, children), kStatusOk);
  const mkv_track_info& t = parse.info().tracks[0];
  EXPECT_EQ(std::make_tuple(t.flag_lacing, t.flag_forced, t.colour_space, t.track_timecode_scale, std::string(t.name), t.track_number),
            std::make_tuple(uint8_t{0}, uint8_t{1}, uint64_t{0x49343230}, 0.5, std::string("Commentary"), uint64_t{2}));
}

// Each allocation fails in turn: the element fails with no memory and leaves
// nothing behind, the seek lists with their exact notices. (Cues and Tags
// fail every allocation within a whole header parse in the index test.)
TEST(HeaderHandlersTest, EveryFailedAllocationIsAnsweredAndLeaksNothing) {
  const struct {
    const Kind& kind;
    Bytes payload;
    std::vector<const char*> messages;  // logged when allocation 1, 2, ... fails
  } cases[] = {
      {kTrackH, cat({str(kName, "name"), str(kLanguage, "eng"), str(kCodecId, "V_MPEG4/ISO/AVC"), bin(kCodecPrivate, {1, 2, 3}),
                     str(kCodecName, "codec"),
                     master(kContentEncoding, {bin(kContentCompSettings, {1}), bin(kContentEncKeyId, {2}), bin(kContentSignature, {3}),
                                               bin(kContentSigKeyId, {4})}),
                     master(kContentEncoding, {bin(kContentCompSettings, {5})}), str(kName, "renamed")}), {}},
      {kSeekH, cat({seek(kInfo, 1), seek(kTracks, 2)}),
       {nullptr, nullptr, "Can't allocate new seek entry.", "Can't allocate new queue entry."}},
  };
  for (const auto& c : cases) {
    for (uint64_t failing = 1; failing < 40; ++failing) {
      int64_t live = host::LiveBlockCount();
      {
        LogRecorder log;
        HeaderParse parse(c.payload);
        host::FailNthAllocation(failing);
        int status = RunHandler(parse, c.kind, c.payload);
        host::FailNthAllocation(0);
        if (status == kStatusOk) break;
        EXPECT_EQ(status, kStatusNoMemory) << c.kind.describe(parse.info()) << ", allocation " << failing;
        const char* message = failing <= c.messages.size() ? c.messages[failing - 1] : nullptr;
        EXPECT_TRUE(!message || log.Contains(kAoLogNotice, message)) << message;
        EXPECT_EQ(c.kind.id == kSeekHead ? seeks_of(parse.info()) : "heads 0", "heads 0");
      }
      EXPECT_EQ(host::LiveBlockCount(), live) << c.kind.id << ", allocation " << failing;
      ASSERT_LT(failing, 39u) << "allocations never stop failing";
    }
  }
}

TEST(HeaderHandlersTest, SecondCuesElementReplacesTheFirstWithoutLeaking) {
  Bytes first = point(1, cat({position(1, 10, ref(4)), position(2, 10)}));
  Bytes second = point(2, position(1, 20));
  int64_t live = host::LiveBlockCount();
  {
    HeaderParse parse(cat({first, second}));
    ASSERT_EQ(RunHandler(parse, kCueH, first), kStatusOk);
    ASSERT_EQ(RunHandler(parse, kCueH, second), kStatusOk);
    EXPECT_EQ(cues_of(parse.info()), "2:1/20/1/0[] met info lost");
    EXPECT_EQ(host::LiveBlockCount(), live + 1 /* stream buffer */ + 4 /* point, position and their nodes */);
    ASSERT_EQ(RunHandler(parse, kCueH, {}), kStatusOk);  // an empty Cues element empties the list and clears the flag
    EXPECT_EQ(cues_of(parse.info()), " info lost");
  }
  EXPECT_EQ(host::LiveBlockCount(), live);
}

}  // namespace
