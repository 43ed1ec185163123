#pragma once
// The EBML and Matroska elements the tool names: ID, name, value type and
// the element they belong in. Unknown IDs are shown by number.

#include <cstdint>

namespace reading {

enum class ValueType : uint8_t { master, uint, sint, floating, ascii, utf8, date, binary };

struct ElementKind {
  uint32_t id;      // with its length-marker bits, as stored
  const char* name;
  ValueType type;
  uint32_t parent;  // 0: the top level; 1: anywhere (Void, CRC-32)
};

// Null for an ID the table does not know.
const ElementKind* FindElementKind(uint32_t id);

// IDs the tool's readers look for.
namespace ids {
constexpr uint32_t kEbml = 0x1A45DFA3;
constexpr uint32_t kSegment = 0x18538067;
constexpr uint32_t kSeekHead = 0x114D9B74;
constexpr uint32_t kSeek = 0x4DBB;
constexpr uint32_t kSeekId = 0x53AB;
constexpr uint32_t kSeekPosition = 0x53AC;
constexpr uint32_t kInfo = 0x1549A966;
constexpr uint32_t kDuration = 0x4489;
constexpr uint32_t kDateUtc = 0x4461;
constexpr uint32_t kSegmentUid = 0x73A4;
constexpr uint32_t kCluster = 0x1F43B675;
constexpr uint32_t kCues = 0x1C53BB6B;
constexpr uint32_t kTracks = 0x1654AE6B;
constexpr uint32_t kTrackEntry = 0xAE;
constexpr uint32_t kTrackNumber = 0xD7;
constexpr uint32_t kTrackUid = 0x73C5;
constexpr uint32_t kLanguageIetf = 0x22B59D;
constexpr uint32_t kTags = 0x1254C367;
constexpr uint32_t kTag = 0x7373;
constexpr uint32_t kTargets = 0x63C0;
constexpr uint32_t kTargetTypeValue = 0x68CA;
constexpr uint32_t kTargetType = 0x63CA;
constexpr uint32_t kTagTrackUid = 0x63C5;
constexpr uint32_t kTagEditionUid = 0x63C9;
constexpr uint32_t kTagChapterUid = 0x63C4;
constexpr uint32_t kTagAttachmentUid = 0x63C6;
constexpr uint32_t kSimpleTag = 0x67C8;
constexpr uint32_t kTagName = 0x45A3;
constexpr uint32_t kTagLanguage = 0x447A;
constexpr uint32_t kTagLanguageIetf = 0x447B;
constexpr uint32_t kTagDefault = 0x4484;
constexpr uint32_t kTagString = 0x4487;
constexpr uint32_t kTagBinary = 0x4485;
constexpr uint32_t kChapters = 0x1043A770;
constexpr uint32_t kEditionEntry = 0x45B9;
constexpr uint32_t kEditionUid = 0x45BC;
constexpr uint32_t kEditionFlagHidden = 0x45BD;
constexpr uint32_t kEditionFlagDefault = 0x45DB;
constexpr uint32_t kEditionFlagOrdered = 0x45DD;
constexpr uint32_t kChapterAtom = 0xB6;
constexpr uint32_t kChapterUid = 0x73C4;
constexpr uint32_t kChapterTimeStart = 0x91;
constexpr uint32_t kChapterTimeEnd = 0x92;
constexpr uint32_t kChapterFlagHidden = 0x98;
constexpr uint32_t kChapterFlagEnabled = 0x4598;
constexpr uint32_t kChapterDisplay = 0x80;
constexpr uint32_t kChapString = 0x85;
constexpr uint32_t kChapLanguage = 0x437C;
constexpr uint32_t kChapLanguageIetf = 0x437D;
constexpr uint32_t kAttachments = 0x1941A469;
constexpr uint32_t kAttachedFile = 0x61A7;
constexpr uint32_t kFileDescription = 0x467E;
constexpr uint32_t kFileName = 0x466E;
constexpr uint32_t kFileMimeType = 0x4660;
constexpr uint32_t kFileData = 0x465C;
constexpr uint32_t kFileUid = 0x46AE;
constexpr uint32_t kVoid = 0xEC;
constexpr uint32_t kCrc32 = 0xBF;
}  // namespace ids

}  // namespace reading
