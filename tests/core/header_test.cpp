// The header parse over crafted files and elements: what the walker and each
// element handler store, answer and log; the metadata list built from the
// file; and every allocation of a whole parse failing in turn. Real files are
// compared with the tools' view in the fixture test.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <iomanip>
#include <sstream>
#include <string>
#include <vector>

#include "core/header/element_handlers.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "platform/ao_log.h"
#include "host/heap_control.h"
#include "tests/support/allocation_failures.h"
#include "tests/support/ebml_builder.h"
#include "tests/support/header_parse.h"
#include "tests/support/log_recorder.h"

namespace {

using namespace ebml;
using testing_support::HeaderParse;
using testing_support::HeaderParseOptions;
using Strings = std::vector<std::string>;

template <typename T>
std::string n(T value) { return std::to_string(value); }
std::string text(const char* s) { return s ? s : "-"; }
template <typename Make>
Bytes repeat(int count, Make make) {
  Bytes out;
  for (int i = 0; i < count; ++i) out = cat({out, make(i)});
  return out;
}

// Fields that differ from the record's defaults, as "name value", or "defaults".
struct Fields {
  std::ostringstream out;
  template <typename T, typename D>
  Fields& add(const char* name, T value, D fallback) {
    if (value == fallback) return *this;
    out << (out.tellp() ? " " : "") << name << " " << std::setprecision(15);
    if constexpr (std::is_arithmetic_v<T>) out << +value; else out << value;
    return *this;
  }
  std::string done() { return out.tellp() ? out.str() : "defaults"; }
};

// Calls each(index, entry) for the entries of a queue of T.
template <typename T, typename Each>
void walk(const mkv_queue& queue, Each each) {
  mkv_queue_node* node = queue.head;
  for (uint32_t k = 0; k < queue.count; ++k, node = node->next) each(k, *static_cast<const T*>(node->data));
}

std::string info_of(const mkv_file_info& i) {
  const char* none = nullptr;
  Fields f;
  f.add("scale", i.timecode_scale, uint64_t{1000000}).add("duration", i.duration, 0.0).add("date", i.date_utc, int64_t{0});
  f.add("uid", n(i.segment_uid[0]) + ".." + n(i.segment_uid[15]), std::string("0..0"));
  f.add("title", (const char*)i.title, none).add("file", (const char*)i.segment_filename, none);
  return f.add("unmet", !(i.parse_flags & kMetInfo), false).done();
}

// The first track's fields and its encodings as order/scope/settings size (k: a key ID).
std::string track_of(const mkv_file_info& i) {
  if (i.track_count == 0) return "none";
  const mkv_track_info& t = i.tracks[0];
  const char* none = nullptr;
  Fields f;
  f.add("number", t.track_number, 0u).add("channels", t.channels, 1u).add("width", t.pixel_width, 0u);
  f.add("name", (const char*)t.name, none).add("codec", t.codec_id ? std::strlen(t.codec_id) : 0, 0u);
  f.add("private", t.codec_private_size, 0u).add("enc", t.encrypted, 0).add("comp", t.compressed, 0);
  f.add("lacing", t.flag_lacing, 1).add("forced", t.flag_forced, 0).add("colour", t.colour_space, 0u);
  f.add("scale", t.track_timecode_scale, 1.0);
  for (uint32_t e = 0; e < t.content_encoding_count; ++e) {
    const mkv_content_encoding& c = t.content_encodings[e];
    f.out << " " << c.order << "/" << c.scope << "/" << c.comp_settings_size << (c.enc_key_id ? "k" : "");
  }
  return f.done();
}

// List 0 as id@position in list order; the count and the flag.
std::string seeks_of(const mkv_file_info& i) {
  std::ostringstream out;
  walk<mkv_seek_entry>(i.seek_lists[0], [&](uint32_t, const auto& e) {
    out << std::hex << std::uppercase << e.seek_id << std::dec << "@" << e.seek_position << " ";
  });
  return out.str() + "heads " + n(i.seek_head_count) + ((i.parse_flags & kMetSeekHead) ? " met" : "");
}

// "time:track/cluster/block/state[ref,ref];track/..." per point, "|" between
// points; the Cues flag; the Info flag set beforehand must stay.
std::string cues_of(const mkv_file_info& i) {
  std::ostringstream out;
  walk<mkv_cue_point>(i.cue_points, [&](uint32_t p, const auto& point) {
    out << (p ? "|" : "") << point.cue_time << ":";
    walk<mkv_cue_track_position>(point.track_positions, [&](uint32_t t, const auto& position) {
      out << (t ? ";" : "") << position.cue_track << "/" << position.cue_cluster_position << "/"
          << position.cue_block_number << "/" << position.cue_codec_state << "[";
      walk<mkv_cue_reference>(position.references,
                              [&](uint32_t r, const auto& ref) { out << (r ? "," : "") << ref.cue_ref_time; });
      out << "]";
    });
  });
  return out.str() + ((i.parse_flags & kMetCues) ? " met" : "") + ((i.parse_flags & kMetInfo) ? "" : " info lost");
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

// What a whole walk left: tracks (all/video/audio, the last one's number), seek
// lists (and the last one's entries), cue points, tags (the last name), title.
std::string parsed(const mkv_file_info& i) {
  std::string out = "tracks " + n(i.track_count) + "/" + n(i.video_track_count) + "/" + n(i.audio_track_count);
  if (i.track_count) out += " #" + n(i.tracks[i.track_count - 1].track_number);
  out += " seek heads " + n(i.seek_head_count);
  if (i.seek_head_count) out += " (" + n(i.seek_lists[i.seek_head_count - 1].count) + ")";
  out += " cues " + n(i.cue_points.count) + " tags " + n(i.tag_count);
  if (i.tag_count) out += " " + text(i.tags[i.tag_count - 1].name);
  return out + " title " + text(i.title) + " mux " + text(i.muxing_app);
}

// How a row is run: a handler over the row's bytes as one element's data
// (whose header claims `claimed` more bytes than there are), or a whole parse.
struct Kind {
  int (*handler)(mkv_file_info*, mkvvstream*, uint32_t*, uint64_t*);  // null: parse_mkvfile (or valid_mkv)
  uint32_t id;
  std::string (*describe)(const mkv_file_info&);
};
const Kind kInfoH{mkv_info_handler, kInfo, info_of}, kTrackH{mkv_track_handler, kTrackEntry, track_of},
    kSeekH{mkv_meta_seek_handler, kSeekHead, seeks_of}, kCueH{mkv_cue_handler, kCues, cues_of},
    kTagH{mkv_tag_handler, kTags, tags_of}, kParse{nullptr, 0, parsed}, kValid{nullptr, 0, nullptr};

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
Bytes many_tags(int count) { return repeat(count, [](int i) { return simple_tag("T" + n(i), "v" + n(i)); }); }
// An element header announcing `announced` bytes of which `present` follow.
Bytes cut(uint32_t id, uint64_t announced, size_t present) { return cat({id_bytes(id), size_bytes(announced), filler(present, 0x41)}); }
// Buffers a track already holds when a later child fails must go with it.
Bytes held() { return cat({str(kName, "held"), bin(kCodecPrivate, {1, 2, 3}), master(kContentEncoding, {bin(kContentCompSettings, {7})})}); }
Bytes encodings(uint64_t first, uint64_t last) {
  return element(kContentEncodings, repeat(int(last - first + 1), [&](int i) {
                   return master(kContentEncoding, {uinteger(kContentEncodingOrder, first + uint64_t(i)),
                                                    master(kContentCompression, {bin(kContentCompSettings, {0x0F})})});
                 }));
}

Bytes file(std::initializer_list<Bytes> segment_children, std::string_view doc_type = "matroska") {
  return cat({ebml_header(doc_type), master(kSegment, segment_children)});
}
Bytes info_with_title(std::string_view title) { return master(kInfo, {uinteger(kTimecodeScale, 1000000), str(kTitle, title)}); }
Bytes entry(uint64_t number, uint64_t type = 2) { return master(kTrackEntry, {uinteger(kTrackNumber, number), uinteger(kTrackType, type)}); }
Bytes one_track() { return master(kTracks, {entry(1)}); }
Bytes nested_chapters(int depth, const Bytes& innermost) {
  return depth ? element(kChapters, nested_chapters(depth - 1, innermost)) : innermost;
}
// List i holds i + 1 entries.
Bytes seek_heads(int count) { return repeat(count, [](int i) { return element(kSeekHead, repeat(i + 1, [](int k) { return seek(kInfo, uint64_t(k)); })); }); }
// Odd numbers are AVC video, even ones AC-3 audio.
Bytes track_entries(int count) {
  return repeat(count, [](int i) {
    uint64_t number = uint64_t(i) + 1;
    return number % 2 ? master(kTrackEntry, {uinteger(kTrackNumber, number), uinteger(kTrackType, 1), str(kCodecId, "V_MPEG4/ISO/AVC"),
                                             uinteger(kDefaultDuration, 40000000), master(kVideo, {uinteger(kPixelWidth, 320), uinteger(kPixelHeight, 240)})})
                      : master(kTrackEntry, {uinteger(kTrackNumber, number), uinteger(kTrackType, 2), str(kCodecId, "A_AC3"),
                                             master(kAudio, {f64(kSamplingFrequency, 48000.0), uinteger(kChannels, 2)})});
  });
}
Bytes tracks(int count) { return element(kTracks, track_entries(count)); }
Bytes tags(std::string_view name, std::string_view value = "v") { return master(kTags, {element(kTag, simple_tag(name, value))}); }
Bytes cluster(uint64_t timecode, size_t payload) { return master(kCluster, {uinteger(kTimecode, timecode), bin(kSimpleBlock, filler(payload))}); }
Bytes cues() { return master(kCues, {point(0, position(1, 300, ref(1))), point(40, position(2, 300))}); }
// A byte that cannot start an ID: reading it ends the walk of the Segment.
Bytes trap() { return Bytes{0x00, 0x00, 0x00}; }

// EBML header, then a Segment of a SeekHead listing each part under the ID
// `listed` gives it (0 or none: not listed) and the parts in order, the Segment's size ending after
// the first `inside` parts. Seek positions are written 8 bytes wide, so the
// SeekHead's size never depends on them; `tail` ends the SeekHead.
Bytes indexed(const std::vector<Bytes>& parts, std::vector<uint32_t> listed, const Bytes& tail = {}, size_t inside = SIZE_MAX) {
  listed.resize(parts.size());
  auto seek_head = [&](uint64_t start) {
    Bytes payload;
    for (size_t i = 0; i < parts.size(); start += parts[i++].size()) {
      if (listed[i]) payload = cat({payload, master(kSeek, {element(kSeekId, id_bytes(listed[i])), uinteger(kSeekPosition, start, 8)})});
    }
    return element(kSeekHead, cat({payload, tail}), 8);
  };
  Bytes segment = seek_head(seek_head(0).size()), outside;
  for (size_t i = 0; i < parts.size(); ++i) {
    Bytes& into = i < inside ? segment : outside;
    into = cat({into, parts[i]});
  }
  return cat({ebml_header(), element(kSegment, segment, 8), outside});
}
// Info, Tracks, two Clusters, Tags MIDDLE, a trap, a Cluster, Cues and Tags END,
// listed as given: what was read behind the trap was jumped to.
Bytes jumps(const std::vector<uint32_t>& listed, const Bytes& tail = {}, size_t inside = SIZE_MAX) {
  return indexed({info_with_title("t"), tracks(1), cluster(0, 2000), cluster(1, 2000), tags("MIDDLE"), trap(), cluster(3, 2000),
                  cues(), tags("END")},
                 listed, tail, inside);
}
// Info, Tracks, `clusters` Clusters of 64 KiB, Cues, Tags, listed or not.
Bytes long_file(int clusters, bool listed) {
  std::vector<Bytes> parts = {info_with_title("t"), tracks(1)};
  for (int i = 0; i < clusters; ++i) parts.push_back(cluster(uint64_t(i), 64 * 1024));
  parts.insert(parts.end(), {cues(), tags("END")});
  std::vector<uint32_t> ids = {kInfo, kTracks};
  ids.resize(parts.size() - 2);
  ids.insert(ids.end(), {kCues, kTags});
  return indexed(parts, listed ? ids : std::vector<uint32_t>{});
}

const char* const kReadError = "5 Error Reading at line *";

struct Row {
  const char* name;
  const Kind& kind;
  Bytes bytes;
  int status;
  std::string want;  // "": not compared
  Strings log = {};  // every message, "level text" ('*' at the end matches any rest)
  int64_t claimed = 0;
  HeaderParseOptions options = {};
  int64_t read_below = 0;  // > 0: the parse reads fewer bytes; < 0: more than minus this
};

TEST(HeaderParseTest, ElementsAreStoredAnsweredAndLogged) {
  const Row rows[] = {
      // Info: values as encoded; a wrong size fails the element.
      {"Info: nothing", kInfoH, {}, kStatusOk, "defaults"},
      {"Info: DateUTC of one byte 0xFF", kInfoH, element(kDateUtc, {0xFF}), kStatusOk, "date -1"},
      {"Info: TimecodeScale of length 0, single Duration, DateUTC of eight bytes, UID, filename, a later Title", kInfoH,
       cat({element(kTimecodeScale, {}), element(kDuration, {0x45, 0xFA, 0x00, 0x00}), sinteger(kDateUtc, -1234567890123, 8),
            bin(kSegmentUid, {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16}), str(kTitle, "A"), str(kSegmentFilename, "f.mkv"), str(kTitle, "B")}),
       kStatusOk, "scale 0 duration 8000 date -1234567890123 uid 1..16 title B file f.mkv"},
      {"Info: UID of 15 bytes", kInfoH, bin(kSegmentUid, filler(15)), kStatusMalformed, ""},
      {"Info: Duration of 2 bytes", kInfoH, element(kDuration, {0x45, 0xFA}), kStatusMalformed, ""},
      {"Info: DateUTC of 9 bytes", kInfoH, element(kDateUtc, filler(9, 1)), kStatusMalformed, ""},

      // TrackEntry: a bad or cut child fails the entry and frees it; an early end keeps what was read.
      {"Track: integer of 9 bytes", kTrackH, cat({held(), element(kTrackNumber, filler(9, 1))}), kStatusMalformed, "none", {kReadError}, 64},
      {"Track: float of 2 bytes", kTrackH, cat({held(), element(kTrackTimecodeScale, {0x3F, 0x00})}), kStatusMalformed, "none", {kReadError}, 64},
      {"Track: string cut short", kTrackH, cat({held(), cut(kCodecName, 20, 3)}), kStatusReadFailed, "none", {kReadError}, 64},
      {"Track: codec ID cut short", kTrackH, cat({held(), cut(kCodecId, 20, 3)}), kStatusReadFailed, "none", {kReadError}, 64},
      {"Track: encoding payload cut short", kTrackH, cat({held(), cut(kContentSigKeyId, 9, 1)}), kStatusReadFailed, "none", {kReadError}, 64},
      {"Track: ID byte 0x0F ends the entry", kTrackH, cat({uinteger(kTrackNumber, 5), Bytes{0x0F, 0x81, 0x00}, uinteger(kChannels, 6)}), kStatusOk,
       "number 5"},
      {"Track: entry ends before the next child", kTrackH, cat({uinteger(kTrackNumber, 5), uinteger(kChannels, 6)}), kStatusOk, "number 5", {}, -3},
      {"Track: Name at the limit, CodecID one below it, CodecPrivate at the bound", kTrackH,
       cat({str(kName, std::string(8192, 'n')), str(kCodecId, std::string(8191, 'V')), bin(kCodecPrivate, filler(32768, 3))}), kStatusOk,
       "name " + std::string(8192, 'n') + " codec 8191 private 32768"},
      {"Track: Name past the limit", kTrackH, str(kName, std::string(8193, 'n')), kStatusNoMemory, "none", {kReadError}},
      {"Track: CodecID at the limit", kTrackH, str(kCodecId, std::string(8192, 'V')), kStatusNoMemory, "none", {kReadError}},
      {"Track: CodecPrivate past the bound, no limits", kTrackH, bin(kCodecPrivate, filler(32769, 3)), kStatusNoMemory, "none", {kReadError}, 0,
       {.with_limits = false}},
      // Masters are read as the entry's own children: the Video master claims
      // one byte, an encoding child before any encoding is dropped, and the
      // sixth encoding updates the fifth.
      {"Track: masters and encodings", kTrackH,
       cat({uinteger(kContentEncodingOrder, 7), bin(kContentEncKeyId, {1}), master_sized(kVideo, 1, {uinteger(kPixelWidth, 640)}),
            master(kContentEncodings, {master(kContentEncoding, {uinteger(kContentEncodingScope, 2), master(kContentEncryption, {})})}),
            encodings(10, 15)}),
       kStatusOk, "width 640 enc 1 comp 1 0/2/0 10/1/1 11/1/1 12/1/1 15/1/1"},
      // Flags keep their lowest bit, a ColourSpace other than four bytes is
      // skipped, a later Name replaces the first, an unknown master is not entered.
      {"Track: children by their own rules", kTrackH,
       cat({uinteger(kFlagLacing, 2), uinteger(kFlagForced, 3), element(kTrackTimecodeScale, {0x3F, 0x00, 0x00, 0x00}), str(kName, "first"),
            str(kName, "Commentary"), master(kVideo, {uinteger(kColourSpace, 0x49343230, 4), uinteger(kColourSpace, 0x5959, 2)}),
            element(0x55B0, uinteger(kTrackNumber, 99)), uinteger(kTrackNumber, 2)}),
       kStatusOk, "number 2 name Commentary lacing 0 forced 1 colour 1228157488 scale 0.5"},

      // SeekHead: entries sorted by position keeping file order of ties; a
      // SeekHead without a Seek is not counted; a damaged one is dropped and
      // a value that cannot be read fails it.
      {"Seek: sorted by position, ties in file order", kSeekH, cat({seek(kTags, 70), seek(kCues, 70), seek(kTracks, 70), seek(kInfo, 9)}), kStatusOk,
       "1549A966@9 1254C367@70 1C53BB6B@70 1654AE6B@70 heads 1 met"},
      // Unknown children and a Void; no SeekPosition is the segment's start; a
      // one-byte stored ID; an ID of four bytes in a SeekID of eight; a position over 32 bits.
      {"Seek: entries of every shape", kSeekH,
       cat({bin(kVoid, filler(3)), master(kSeek, {bin(0x4321, filler(2)), seek(kInfo, 6)}), seek(kTags, 4),
            master(kSeek, {element(kSeekId, id_bytes(kCues))}), seek(kVoid, 8),
            master(kSeek, {element(kSeekId, cat({id_bytes(kCues), bin(kVoid, {0, 0})})), uinteger(kSeekPosition, 5)}), seek(kCues, 12345678901ull)}),
       kStatusOk, "0@0 1C53BB6B@0 1254C367@4 1C53BB6B@5 1549A966@6 EC@8 1C53BB6B@12345678901 heads 1 met"},
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
      {"Cues: CueBlockNumber, two positions, references, a CodecState, 64-bit values, in file order", kCueH,
       cat({point(7, position(2, 99, uinteger(kCueBlockNumber, 12))),
            point(5, cat({position(1, 10, cat({ref(4), master(kCueReference, {uinteger(kCueRefTime, 6), uinteger(0x97, 1)})})),
                          position(2, 10, uinteger(kCueCodecState, 3))})),
            point(0xFFFFFFFFFFFFFFFFull, position(1, 0x123456789Aull)), point(10, position(1, 100))}),
       kStatusOk, "7:2/99/12/0[]|5:1/10/1/0[4,6];2/10/1/3[]|18446744073709551615:1/78187493530/1/0[]|10:1/100/1/0[] met"},
      {"Cues: orphans before the first CuePoint", kCueH,
       cat({uinteger(kCueTime, 8), uinteger(kCueTrack, 3), master(kCueTrackPositions, {uinteger(kCueTrack, 4)}), ref(2), point(1, position(1, 2))}),
       kStatusOk, "1:1/2/1/0[] met"},
      {"Cues: current position survives a new CuePoint", kCueH,
       cat({point(1, position(1, 2)), element(kCuePoint, {}), uinteger(kCueTrack, 9)}), kStatusOk, "1:9/2/1/0[]|0: met"},
      {"Cues: empty", kCueH, {}, kStatusOk, ""},
      {"Cues: first CueTime of 9 bytes", kCueH, element(kCuePoint, element(kCueTime, filler(9))), kStatusMalformed, "0: met"},
      {"Cues: malformed header after a point", kCueH, cat({point(1, position(1, 2)), Bytes{0xBB, 0x00}}), kStatusMalformed, "1:1/2/1/0[] met"},
      {"Cues: value cut by the end of the file", kCueH, cat({id_bytes(kCuePoint), size_bytes(5), id_bytes(kCueTime), size_bytes(4), Bytes{1}}),
       kStatusReadFailed, "0: met", {}, 16},

      // Tags: each SimpleTag fills the next entry; the first name and string stand.
      {"Tags: nested SimpleTag gets its own entry and stays current", kTagH,
       master(kSimpleTag, {str(kTagName, "A"), simple_tag("B", "bb"), str(kTagString, "late")}), kStatusOk, "2 A=-/-/0 B=bb/-/2"},
      // Values before any SimpleTag are skipped; a binary counts its bytes; the length is the value read last.
      {"Tags: first name and string stand", kTagH,
       cat({str(kTagName, "X"), str(kTagString, "Y"),
            master(kSimpleTag, {str(kTagName, "A"), str(kTagName, "B"), str(kTagString, "1"), str(kTagString, "22")}),
            master(kSimpleTag, {str(kTagName, "C"), bin(kTagBinary, {'p', 'n', 'g', 0, 1})}),
            master(kSimpleTag, {str(kTagString, "four"), bin(kTagBinary, {'b', 'i'})})}),
       kStatusOk, std::string("3 A=1/-/1 C=-/png") + '\0' + "\x01/5 -=four/bi/2"},
      {"Tags: name of 8193", kTagH, master(kSimpleTag, {str(kTagName, std::string(8193, 'n'))}), kStatusNoMemory, "1 -=-/-/0",
       {"5 Error allocating tag name of size 8193"}},
      {"Tags: name of 8193 and binary of 32768 without limits", kTagH,
       master(kSimpleTag, {str(kTagName, std::string(8193, 'n')), bin(kTagBinary, filler(32768, 'b'))}), kStatusOk,
       "1 " + std::string(8193, 'n') + "=-/" + std::string(32768, 'b') + "/32768", {}, 0, {.with_limits = false}},
      {"Tags: string of 8193", kTagH, master(kSimpleTag, {str(kTagString, std::string(8193, 's'))}), kStatusNoMemory, "1 -=-/-/0",
       {"5 Error allocating tag string of size 8193"}},
      {"Tags: binary of 32769", kTagH, master(kSimpleTag, {bin(kTagBinary, filler(32769))}), kStatusNoMemory, "1 -=-/-/0",
       {"5 Error allocating tag binary of size 32769"}, 0, {.with_limits = false}},
      {"Tags: string claiming 2^32 bytes", kTagH, cat({id_bytes(kSimpleTag), size_bytes(20), id_bytes(kTagString), size_bytes(1ull << 32)}),
       kStatusNoMemory, "1 -=-/-/0", {"5 Error allocating tag string of size 4294967296"}, 0, {.with_limits = false}},
      {"Tags: string claiming 2^32 - 1 bytes, one short of its NUL", kTagH,
       cat({id_bytes(kSimpleTag), size_bytes(20), id_bytes(kTagString), size_bytes((1ull << 32) - 1)}), kStatusNoMemory, "1 -=-/-/0",
       {"5 Error allocating tag string of size 4294967295"}, 0, {.with_limits = false}},
      {"Tags: string cut by the end of the file", kTagH, cat({id_bytes(kSimpleTag), size_bytes(40), id_bytes(kTagString), size_bytes(10), Bytes{'a', 'b', 'c'}}),
       kStatusReadFailed, "1 -=-/-/0", {}, 7},
      {"Tags: the fifty-first is logged and dropped", kTagH, many_tags(51), kStatusOk, "50 T0=v0/-/2 T1=v1/-/2 T49=v49/-/3",
       {"5 kelvane:  Too many tags.  Some metadata may be missing."}},

      // The whole walk: its result and what was read.
      {"complete", kParse, file({info_with_title("t"), one_track()}), kParseSucceeded, "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title t mux -"},
      {"no tracks", kParse, file({info_with_title("t")}), kParseIncomplete, "tracks 0/0/0 seek heads 0 cues 0 tags 0 title t mux -"},
      {"no info", kParse, file({one_track()}), kParseIncomplete, "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title - mux -"},
      {"no EBML header", kParse, master(kSegment, {info_with_title("t"), one_track()}), kParseIncomplete, ""},
      {"malformed top-level element", kParse, cat({ebml_header(), Bytes{0x00, 0x81, 0x00}}), kParseMalformed, ""},
      {"DocType of 31 bytes", kParse, file({info_with_title("t"), one_track()}, std::string(31, 'm')), kParseSucceeded,
       "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title t mux -"},
      {"DocType of 32 bytes", kParse, file({info_with_title("t"), one_track()}, std::string(32, 'm')), kParseNoMemory, "",
       {"2 Error parsing EBML Document Element."}},
      {"Info failing after tracks", kParse, file({one_track(), master(kInfo, {bin(kSegmentUid, filler(15))})}), kParseSucceeded, "",
       {"2 Error parsing Info Element."}},
      {"Info failing before tracks", kParse, file({master(kInfo, {bin(kSegmentUid, filler(15))}), one_track()}), kParseMalformed, "",
       {"2 Error parsing Info Element."}},
      {"Info cut inside a child header", kParse,
       cat({ebml_header(), master(kSegment, {one_track()}), master_sized(kInfo, 8, {str(kTitle, "kept"), Bytes{0x7B}})}), kParseSucceeded,
       "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title kept mux -"},
      // The Segment is level 1, so the Void inside n nested Chapters is at level n + 2.
      {"50 levels", kParse, file({nested_chapters(48, bin(kVoid, filler(1))), info_with_title("t"), one_track()}), kParseSucceeded,
       "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title t mux -"},
      {"51 levels", kParse, file({nested_chapters(49, bin(kVoid, filler(1))), info_with_title("t"), one_track()}), kParseMalformed, ""},
      {"Void, CRC-32, unknown and unhandled elements are skipped", kParse,
       file({bin(kVoid, filler(300)), bin(kCrc32, filler(4, 0xAB)), bin(0x4321, filler(10)),
             master(kAttachments, {bin(0x61A7, filler(700)), bin(kVoid, filler(3))}), master(kChapters, {bin(0x45B9, filler(20))}),
             master(kTracks, {bin(kVoid, filler(2)), master(kTrackEntry, {uinteger(kTrackNumber, 1)})}), info_with_title("t")}),
       kParseSucceeded, "tracks 1/0/0 #1 seek heads 0 cues 0 tags 0 title t mux -"},
      // Inside Info the handler stops quietly and the walker goes on behind Info;
      // inside the Segment everything after the bad byte is gone.
      {"malformed child of Info", kParse,
       file({master(kInfo, {str(kTitle, "t"), Bytes{0x0F, 0x81, 0x00}, str(kMuxingApp, "lost")}), one_track()}), kParseSucceeded,
       "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title t mux -"},
      {"malformed child of the Segment", kParse, file({info_with_title("t"), Bytes{0x00, 0x85}, one_track()}), kParseIncomplete,
       "tracks 0/0/0 seek heads 0 cues 0 tags 0 title t mux -"},
      {"second EBML header ends the walk", kParse, cat({file({info_with_title("t"), one_track()}), file({info_with_title("second")})}),
       kParseSucceeded, "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title t mux -",
       {"3 vorlith:  Only single EBML document files supported.", "2 Error parsing EBML Document Element."}},
      {"TrackType counts each time it is met", kParse,
       file({info_with_title("t"), master(kTracks, {entry(1), entry(2), master(kTrackEntry, {uinteger(kTrackType, 1), uinteger(kTrackType, 1)}),
                                                    entry(4, 3)})}),
       kParseSucceeded, "tracks 4/2/2 #4 seek heads 0 cues 0 tags 0 title t mux -"},
      {"the 101st track fails the parse", kParse, file({info_with_title("t"), tracks(101)}), kParseNoMemory,
       "tracks 100/50/50 #100 seek heads 0 cues 0 tags 0 title t mux -",
       {"2 mkv_track_handler:  File contains too many tracks.", "2 Error parsing TrackEntry Element."}},
      {"50 seek lists are kept", kParse, file({seek_heads(52), info_with_title("t"), one_track()}), kParseSucceeded,
       "tracks 1/0/1 #1 seek heads 50 (50) cues 0 tags 0 title t mux -"},
      {"a second Info starts afresh", kParse,
       file({master(kInfo, {uinteger(kTimecodeScale, 500), str(kTitle, "one")}), master(kInfo, {str(kMuxingApp, "two")}), one_track()}),
       kParseSucceeded, "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title - mux two"},
      {"a second Cues replaces the first", kParse,
       file({info_with_title("t"), one_track(), cues(), master(kCues, {point(2, position(1, 20))})}), kParseSucceeded,
       "tracks 1/0/1 #1 seek heads 0 cues 1 tags 0 title t mux -"},
      {"unknown-size Segment and Cluster, unseekable", kParse,
       cat({ebml_header(), unknown_size(kSegment, {bin(kVoid, filler(600)), info_with_title("t"), one_track(), unknown_size(kCluster, {filler(100)})})}),
       kParseSucceeded, "tracks 1/0/1 #1 seek heads 0 cues 0 tags 0 title t mux -", {}, 0, {.seekable = false}},
      // After the first Cluster the walk goes on at the first seek target at
      // or after it that is not a Cluster; the trap ends any walk that reaches it.
      {"jump: cues and tags behind everything", kParse, jumps({0, 0, 0, 0, 0, 0, 0, kCues, kTags}), kParseSucceeded,
       "tracks 1/1/0 #1 seek heads 1 (2) cues 2 tags 1 END title t mux -"},
      {"jump: tags between clusters, then cues", kParse, jumps({0, 0, 0, 0, kTags, 0, 0, kCues, kTags}), kParseSucceeded,
       "tracks 1/1/0 #1 seek heads 1 (3) cues 2 tags 2 END title t mux -"},
      {"jump: only clusters listed", kParse, jumps({0, 0, kCluster, kCluster, 0, 0, kCluster}), kParseSucceeded,
       "tracks 1/1/0 #1 seek heads 1 (3) cues 0 tags 1 MIDDLE title t mux -"},
      {"jump: only targets before the first cluster", kParse, jumps({kInfo, kTracks}), kParseSucceeded,
       "tracks 1/1/0 #1 seek heads 1 (2) cues 0 tags 1 MIDDLE title t mux -"},
      {"jump: damaged SeekHead", kParse, jumps({0, 0, 0, 0, 0, 0, 0, kCues, kTags}, Bytes{0x00, 0x00}), kParseSucceeded,
       "tracks 1/1/0 #1 seek heads 0 cues 0 tags 1 MIDDLE title t mux -"},
      // A Segment that ends after the first Cluster: the jump is made between top-level elements.
      {"jump: behind a Segment that ends early", kParse, jumps({0, 0, 0, 0, 0, 0, 0, kCues, kTags}, {}, 3), kParseSucceeded,
       "tracks 1/1/0 #1 seek heads 1 (2) cues 2 tags 1 END title t mux -"},
      {"jump: 10 MiB of clusters cost nothing", kParse, long_file(160, true), kParseSucceeded,
       "tracks 1/1/0 #1 seek heads 1 (4) cues 2 tags 1 END title t mux -", {}, 0, {}, 4096},
      // Without the SeekHead's entries every Cluster header costs a buffer refill.
      {"no jump: every cluster is read", kParse, long_file(160, false), kParseSucceeded,
       "tracks 1/1/0 #1 seek heads 0 cues 2 tags 1 END title t mux -", {}, 0, {}, -160 * 64},

      // valid_mkv: exactly the matroska DocType.
      {"valid", kValid, file({}), kStatusOk, ""},
      {"webm", kValid, file({}, "webm"), kStatusMalformed, ""},
      {"Matroska", kValid, file({}, "Matroska"), kStatusMalformed, ""},
      {"matrosk", kValid, file({}, "matrosk"), kStatusMalformed, ""},
      {"Segment first", kValid, cat({master(kSegment, {}), ebml_header()}), kStatusMalformed, ""},
  };
  for (const Row& c : rows) {
    SCOPED_TRACE(c.name);
    const int64_t live = host::LiveBlockCount();
    {
      testing_support::LogRecorder log;
      // Bytes behind an element, except where a read must meet the end of the file.
      const bool trailer = c.kind.handler && c.status == kStatusOk && c.claimed <= 0;
      HeaderParse parse(trailer ? cat({c.bytes, filler(8)}) : c.bytes, c.options);
      int status;
      if (c.kind.handler) {
        parse.info().parse_flags = c.kind.id == kCues ? kMetInfo : 0;
        uint32_t id = c.kind.id;
        uint64_t size = c.bytes.size() + static_cast<uint64_t>(c.claimed);
        status = c.kind.handler(&parse.info(), &parse.stream(), &id, &size);
      } else {
        status = c.kind.describe ? parse.Parse() : parse.Validate();
      }
      EXPECT_EQ(status, c.status);
      if (!c.want.empty() || c.kind.id == kCues) {
        EXPECT_EQ(c.kind.describe(parse.info()), c.want);
      }
      if (trailer && (c.kind.id == kSeekHead || c.kind.id == kTags)) {
        EXPECT_EQ(mkvvstream_tell(&parse.stream()), c.bytes.size()) << "not at the element's end";
      }
      const uint64_t read = parse.input().counters().bytes_read;
      EXPECT_TRUE(c.read_below >= 0 ? !c.read_below || read < uint64_t(c.read_below) : read > uint64_t(-c.read_below)) << read;
      Strings logged;
      for (const auto& [level, t] : log.messages()) logged.push_back(n(level) + " " + t);
      std::vector<testing::Matcher<std::string>> want(c.log.begin(), c.log.end());
      for (size_t i = 0; i < want.size(); ++i) {
        if (c.log[i].ends_with('*')) want[i] = testing::StartsWith(c.log[i].substr(0, c.log[i].size() - 1));
      }
      EXPECT_THAT(logged, testing::ElementsAreArray(want));
    }
    EXPECT_EQ(host::LiveBlockCount(), live);
  }
}

// The metadata list a whole parse builds: offered tags in file order, then
// Seekable (a seekable input with cues, under the creators' limits) and
// TrackCount, then nine entries per video or audio track, up to 250 entries.
// Frame rates round, sampling frequencies and durations truncate, and whatever
// does not fit saturates or gives 0.
Bytes track(uint64_t type, const char* codec, std::initializer_list<Bytes> more) {
  return element(kTrackEntry, cat({uinteger(kTrackType, type), str(kCodecId, codec), cat(more)}));
}
Bytes with_track(const Bytes& one_track, uint64_t scale = 1000000, double duration = 0) {
  return file({master(kInfo, {uinteger(kTimecodeScale, scale), f64(kDuration, duration)}), element(kTracks, one_track)});
}
Bytes video(uint64_t default_duration) { return track(1, "V_X", {uinteger(kDefaultDuration, default_duration)}); }
Bytes audio(double frequency) { return track(2, "A_X", {master(kAudio, {f64(kSamplingFrequency, frequency)})}); }
Bytes mixed_tags(int count) {
  const char* names[] = {"TITLE", "ARTIST", "GENRE", "ALBUM", "COMMENT", "ENCODER"};
  return master(kTags, {element(kTag, repeat(count, [&](int i) { return simple_tag(names[i % 6], "v"); }))});
}

TEST(HeaderParseTest, MetadataListFollowsTheFile) {
  const double kNan = std::nan("");
  const Bytes subtitles = element(kTracks, track(17, "S_TEXT/UTF8", {}));
  const struct {
    const char* name;
    Bytes file;
    size_t entries;
    Strings last;  // the list's last entries, "Key TYPE value"
    HeaderParseOptions options = {};
  } rows[] = {
      {"tags, file and tracks in order",
       file({master(kTags, {element(kTag, cat({simple_tag("ARTIST", "Someone"), simple_tag("title", "lower case is not offered"),
                                                simple_tag("TITLE", "abc"), master(kSimpleTag, {str(kTagName, "GENRE")}),
                                                master(kSimpleTag, {str(kTagName, "ALBUM"), str(kTagString, "xy"), bin(kTagBinary, filler(40, 1))}),
                                                simple_tag("COMMENT", "c"), simple_tag("ENCODER", "not offered")}))}),
             master(kInfo, {f64(kDuration, 5000.0)}), master(kCues, {point(0, position(1, 0))}),
             element(kTracks, cat({track(1, "V_MPEG4/ISO/AVC",
                                         {uinteger(kDefaultDuration, 41708333), master(kAudio, {uinteger(kChannels, 2)}),
                                          master(kVideo, {uinteger(kPixelWidth, 0x100000140), uinteger(kPixelHeight, 240)})}),
                                   subtitles,
                                   track(2, "A_AAC/MPEG4/LC/SBR", {master(kAudio, {f64(kSamplingFrequency, 44100.0), uinteger(kChannels, 6)}),
                                                                  master(kVideo, {uinteger(kPixelWidth, 9)})})}))}),
       24,
       {"Artist UTF8 Someone", "Name UTF8 abc", "Album UTF8 xy", "Comment UTF8 c", "Seekable NUM4 1", "TrackCount NUM4 2",
        "MediaType NUM4 2147483650", "Fourcc NUM4 1096172337", "Width NUM4 320", "Height NUM4 240", "PixelWidth NUM4 1",
        "PixelHeight NUM4 1", "Duration NUM8 5000000", "Channels NUM4 0", "SampleRate NUM4 24", "MediaType NUM4 2147483652",
        "Fourcc NUM4 1295270211", "Width NUM4 0", "Height NUM4 0", "PixelWidth NUM4 1", "PixelHeight NUM4 1", "Duration NUM8 5000000",
        "Channels NUM4 6", "SampleRate NUM4 44100"}},
      // A value of up to 32768 bytes, also of none, is kept; a longer one ends the list.
      {"empty title", file({info_with_title("t"), subtitles, tags("TITLE", "")}), 3, {"Name UTF8 ", "Seekable NUM4 0", "TrackCount NUM4 0"}},
      {"title of 32768 bytes", file({info_with_title("t"), subtitles, tags("TITLE", std::string(32768, 'n'))}), 3,
       {"Name UTF8 " + std::string(32768, 'n'), "Seekable NUM4 0", "TrackCount NUM4 0"}, {.with_limits = false}},
      {"title of 32769 bytes", file({info_with_title("t"), subtitles, tags("TITLE", std::string(32769, 'n'))}), 0, {}, {.with_limits = false}},
      {"cues", file({info_with_title("t"), subtitles, cues()}), 2, {"Seekable NUM4 1", "TrackCount NUM4 0"}},
      {"no cues", file({info_with_title("t"), subtitles}), 2, {"Seekable NUM4 0", "TrackCount NUM4 0"}},
      {"cues on a pipe", file({info_with_title("t"), subtitles, cues()}), 2, {"Seekable NUM4 0", "TrackCount NUM4 0"}, {.seekable = false}},
      {"cues without limits", file({info_with_title("t"), subtitles, cues()}), 2, {"Seekable NUM4 0", "TrackCount NUM4 0"}, {.with_limits = false}},
      {"cues emptied by a second Cues", file({info_with_title("t"), subtitles, cues(), master(kCues, {})}), 2, {"Seekable NUM4 0", "TrackCount NUM4 0"}},
      // An x264 configuration of 200x90 pixels of 97:60.
      {"pixel shape from the codec's configuration",
       with_track(track(1, "V_MPEG4/ISO/AVC", {bin(kCodecPrivate, {0x01, 0x64, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x1E, 0x67, 0x64, 0x00, 0x0B, 0xAC, 0xD9, 0x43, 0x4D,
                                                                    0xE5, 0x93, 0xFF, 0x00, 0x61, 0x00, 0x3C, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03,
                                                                    0x03, 0x20, 0xF1, 0x42, 0x99, 0x60, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xCB, 0x22, 0xC0})})),
       11, {"PixelWidth NUM4 97", "PixelHeight NUM4 60", "Duration NUM8 0", "Channels NUM4 0", "SampleRate NUM4 0"}},
      {"23.976 frames per second", with_track(video(41708333)), 11, {"SampleRate NUM4 24"}},
      {"no DefaultDuration", with_track(video(0)), 11, {"SampleRate NUM4 0"}},
      {"1 ns per frame", with_track(video(1)), 11, {"SampleRate NUM4 1000000000"}},
      {"1000 s per frame", with_track(video(1000000000000)), 11, {"SampleRate NUM4 0"}},
      {"22050.7 Hz", with_track(audio(22050.7)), 11, {"SampleRate NUM4 22050"}},
      {"-2.5 Hz", with_track(audio(-2.5)), 11, {"SampleRate NUM4 " + n(uint32_t(-2))}},
      {"NaN Hz", with_track(audio(kNan)), 11, {"SampleRate NUM4 0"}},
      {"1e12 Hz", with_track(audio(1e12)), 11, {"SampleRate NUM4 " + n(INT32_MAX)}},
      {"-1e12 Hz", with_track(audio(-1e12)), 11, {"SampleRate NUM4 " + n(uint32_t{1} << 31)}},
      {"duration 2.5 of 1 us", with_track(audio(8000), 1000, 2.5), 11, {"Duration NUM8 2", "Channels NUM4 1", "SampleRate NUM4 8000"}},
      {"duration NaN", with_track(audio(8000), 1000000, kNan), 11, {"Duration NUM8 0", "Channels NUM4 1", "SampleRate NUM4 8000"}},
      {"duration 1e300", with_track(audio(8000), 1000000, 1e300), 11, {"Duration NUM8 " + n(INT64_MAX), "Channels NUM4 1", "SampleRate NUM4 8000"}},
      {"duration -1e300", with_track(audio(8000), 1000000, -1e300), 11, {"Duration NUM8 " + n(INT64_MIN), "Channels NUM4 1", "SampleRate NUM4 8000"}},
      // 42 offered tags + 2 + 9 x 22 = 242: a 23rd track adds eight of its nine.
      {"22 tracks and 50 tags", file({info_with_title("t"), tracks(22), mixed_tags(50)}), 242, {"SampleRate NUM4 48000"}},
      {"23 tracks and 50 tags", file({info_with_title("t"), tracks(23), mixed_tags(50)}), 250, {"Duration NUM8 0", "Channels NUM4 0"}},
  };
  for (const auto& c : rows) {
    SCOPED_TRACE(c.name);
    const int64_t live = host::LiveBlockCount();
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    ASSERT_NE(list, nullptr);
    HeaderParseOptions options = c.options;
    options.metadata = list;
    ASSERT_EQ(HeaderParse(c.file, options).Parse(), kParseSucceeded);
    Strings entries;
    for (int i = 0; i < list->entry_count; ++i) {
      const uint32_t type = list->value_type[i];
      const int32_t size = list->value_size[i];
      uint32_t num4 = 0;
      int64_t num8 = 0;
      std::string entry = std::string(list->key[i]) + " ";
      if (type == kMetadataTypeNum4 && size == 4) entry += "NUM4 " + n((std::memcpy(&num4, list->value[i], 4), num4));
      else if (type == kMetadataTypeNum8 && size == 8) entry += "NUM8 " + n((std::memcpy(&num8, list->value[i], 8), num8));
      else entry += (type == kMetadataTypeUtf8 ? "UTF8 " : "type " + n(type) + " ") + std::string((const char*)list->value[i], size_t(size));
      entries.push_back(entry);
    }
    EXPECT_EQ(list->key[list->entry_count], nullptr);
    FreeMetadata(list);
    EXPECT_EQ(host::LiveBlockCount(), live);
    ASSERT_EQ(entries.size(), c.entries) << testing::PrintToString(entries);
    EXPECT_EQ(Strings(entries.end() - ptrdiff_t(c.last.size()), entries.end()), c.last);
  }
}

// A failure during the walk ends the parse with -4; one while the list is
// built leaves a successful parse with a shorter list; the SeekHead names its
// own failures; nothing leaks.
TEST(HeaderParseTest, EveryFailedAllocationIsAnswered) {
  const Bytes rich_track = master(kTrackEntry, {
      uinteger(kTrackNumber, 1), uinteger(kTrackType, 1), str(kName, "name"), str(kLanguage, "eng"), str(kCodecId, "V_MPEG4/ISO/AVC"),
      bin(kCodecPrivate, {1, 2, 3}), str(kCodecName, "codec"),
      master(kContentEncoding, {bin(kContentCompSettings, {1}), bin(kContentEncKeyId, {2}), bin(kContentSignature, {3}), bin(kContentSigKeyId, {4})}),
      master(kContentEncoding, {bin(kContentCompSettings, {5})}), str(kName, "renamed")});
  const Bytes bytes = indexed({master(kInfo, {str(kTitle, "t"), str(kSegmentFilename, "f")}), element(kTracks, cat({rich_track, track_entries(2)})),
                               cluster(0, 600), cues(), mixed_tags(7)},
                              {kInfo, kTracks, 0, kCues, kTags});
  uint64_t all = 0;  // allocations of the whole parse
  int32_t full_list = 0;
  {
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    {
      HeaderParse parse(bytes, {.metadata = list});
      const uint64_t before = host::AllocationCount();
      ASSERT_EQ(parse.Parse(), kParseSucceeded);
      all = host::AllocationCount() - before;
    }
    full_list = list->entry_count;
    FreeMetadata(list);
  }
  EXPECT_EQ(full_list, 6 + 2 + 9 * 3);
  const uint64_t walk = all - 2 * uint64_t(full_list);  // a key and a value per entry
  const char* seek_messages[] = {"Can't allocate new seek entry.", "Can't allocate new queue entry."};
  uint64_t failures = testing_support::EachAllocationFailing([&](uint64_t failing) {
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    testing_support::LogRecorder log;
    bool reached;
    {
      HeaderParse parse(bytes, {.metadata = list});
      testing_support::FailingAllocation failure(failing);
      const int result = parse.Parse();
      reached = failure.Reached();
      EXPECT_EQ(result, failing <= walk ? kParseNoMemory : kParseSucceeded) << failing;
    }
    EXPECT_EQ(list->entry_count, failing <= walk ? 0 : failing <= all ? int32_t(failing - walk - 1) / 2 : full_list) << failing;
    EXPECT_TRUE(failing > 4 || log.Contains(kAoLogNotice, seek_messages[(failing - 1) % 2])) << failing;
    FreeMetadata(list);
    return reached;
  });
  EXPECT_EQ(failures, all);
  EXPECT_GT(walk, 30u);
}

}  // namespace
