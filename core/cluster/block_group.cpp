// SimpleBlock and BlockGroup starts, and the children of a BlockGroup.

#include "core/cluster/block_header.h"
#include "core/cluster/cluster_ids.h"
#include "core/cluster/cluster_status.h"
#include "core/cluster/element_header.h"
#include "core/cluster/mkv_cluster.h"
#include "core/memory.h"
#include "platform/ao_log.h"

namespace {

// A child finished (or nothing was pending): the group loop goes on.
constexpr int kGoOn = 1;

void log_partial_header(const mkvinbuff* inbuff1, const mkvinbuff* inbuff2) {
  AoLog(kAoLogNotice, "Partial header!  Not supposed to happen!");
  AoLog(kAoLogNotice, "                 inbuff1->buff_left = %d, inbuff2->buff_left = %d",
        static_cast<int>(inbuff1->buff_left), inbuff2 ? static_cast<int>(inbuff2->buff_left) : 0);
  AoLog(kAoLogNotice, "                 inbuff1->buff_fileoff = %lld, inbuff2->buff_fileoff = %lld",
        static_cast<long long>(inbuff1->buff_fileoff),
        inbuff2 ? static_cast<long long>(inbuff2->buff_fileoff) : 0LL);
}

// The value read so far goes into its field at every step, so a value cut by
// the end of the buffers is partly there, as the caller may look.
int continue_group_value(buff_cursor* cursor, mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  ebml_number_result read = ebml_continue_number(cursor, ebml_number_form::raw, 0, &resume.number);
  uint64_t value = resume.number.value;
  if (resume.id == cluster_id::kBlockDuration) {
    cluster->block_duration = value;
  } else if (resume.id == cluster_id::kReferencePriority) {
    cluster->reference_priority = value;
  } else {
    uint8_t length = resume.number.length;
    bool extend = read == ebml_number_result::done && length > 0 && length < 8;
    unsigned shift = extend ? 64u - 8u * length : 0u;
    cluster->reference_block = static_cast<int64_t>(value << shift) >> shift;
  }
  if (read == ebml_number_result::short_read) return kClusterChildShort;
  resume.number = {};
  resume.step = mkv_resume_step::none;
  return kGoOn;
}

int start_group_value(buff_cursor* cursor, mkvcluster* cluster, uint32_t id, uint64_t size) {
  if (id == cluster_id::kBlockDuration) cluster->block_duration = 0;
  if (id == cluster_id::kReferencePriority) cluster->reference_priority = 0;
  if (id == cluster_id::kReferenceBlock) cluster->reference_block = 0;
  if (size > 8) return kClusterInvalid;
  mkv_cluster_resume& resume = cluster->resume;
  resume.id = id;
  resume.number = {0, static_cast<uint8_t>(size), static_cast<uint8_t>(size)};
  resume.step = mkv_resume_step::group_value;
  return continue_group_value(cursor, cluster);
}

// Only a CodecState that lies whole in the two buffers is copied; until then
// nothing of it is consumed.
int continue_codec_state(buff_cursor* cursor, mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  auto size = static_cast<uint32_t>(resume.payload_left);
  if (cursor->available() < size) return kClusterChildShort;
  resume.step = mkv_resume_step::none;
  mem_free(cluster->codec_state);
  cluster->codec_state = nullptr;
  cluster->codec_state_size = 0;
  if (size == 0) return kGoOn;
  auto* copy = static_cast<uint8_t*>(mem_alloc(size));
  if (!copy) return kClusterNoMemory;
  cursor->copy_out(copy, size);
  cluster->codec_state = copy;
  cluster->codec_state_size = size;
  return kGoOn;
}

int start_codec_state(buff_cursor* cursor, mkvcluster* cluster, uint64_t size) {
  if (size > kMaxCodecStateSize) {
    mem_free(cluster->codec_state);
    cluster->codec_state = nullptr;
    cluster->codec_state_size = 0;
    return kClusterNoMemory;
  }
  cluster->resume.payload_left = size;
  cluster->resume.step = mkv_resume_step::codec_state;
  return continue_codec_state(cursor, cluster);
}

// Payloads the parser does not read are passed over, never read as headers;
// a payload longer than the buffers is passed over across calls.
int continue_group_payload(buff_cursor* cursor, mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  resume.payload_left -= cursor->skip_up_to(resume.payload_left);
  if (resume.payload_left) return kClusterChildShort;
  resume.step = mkv_resume_step::none;
  return kGoOn;
}

int start_group_payload(buff_cursor* cursor, mkvcluster* cluster, uint64_t size) {
  cluster->resume.payload_left = bytes_within(cursor->position(), cluster->blockgroup_end, size);
  cluster->resume.step = mkv_resume_step::group_payload;
  return continue_group_payload(cursor, cluster);
}

// The child that the last call stopped inside, if any.
int continue_group_child(buff_cursor* cursor, mkvcluster* cluster) {
  switch (cluster->resume.step) {
    case mkv_resume_step::group_value:
      return continue_group_value(cursor, cluster);
    case mkv_resume_step::group_payload:
      return continue_group_payload(cursor, cluster);
    case mkv_resume_step::codec_state:
      return continue_codec_state(cursor, cluster);
    default:
      return kGoOn;
  }
}

}  // namespace

int start_newmkvblock(mkvinbuff* inbuff1, mkvinbuff* inbuff2, mkvcluster* cluster, uint64_t* skip, uint32_t id,
                      uint64_t size) {
  (void)skip;
  buff_cursor cursor{inbuff1, inbuff2};
  cluster->resume.step = mkv_resume_step::none;
  if (id == cluster_id::kSimpleBlock) {
    cluster->in_blockgroup = 0;
    return begin_block(&cursor, cluster, size);
  }
  if (id != cluster_id::kBlockGroup) return kClusterInvalid;
  cluster->in_blockgroup = 1;
  cluster->blockgroup_size = size;
  cluster->blockgroup_start = cursor.position();
  cluster->blockgroup_end = element_end(cluster->blockgroup_start, size);
  // The values describe the current group only.
  cluster->block_duration = 0;
  cluster->reference_priority = 0;
  cluster->reference_block = 0;
  return parse_mkvblockgroup(inbuff1, inbuff2, cluster);
}

int parse_mkvblockgroup(mkvinbuff* inbuff1, mkvinbuff* inbuff2, mkvcluster* cluster) {
  buff_cursor cursor{inbuff1, inbuff2};
  mkv_cluster_resume& resume = cluster->resume;
  if (is_block_header_step(resume.step)) return continue_block_header(&cursor, cluster);
  int result = continue_group_child(&cursor, cluster);
  while (result == kGoOn &&
         (resume.step == mkv_resume_step::group_header || cursor.position() < cluster->blockgroup_end)) {
    element_header child;
    header_result read = read_element_header(&cursor, &resume, mkv_resume_step::group_header, &child);
    if (read != header_result::done) {
      result = kClusterChildShort;
      break;
    }
    switch (child.id) {
      case cluster_id::kBlock:
        return begin_block(&cursor, cluster, child.size);
      case cluster_id::kBlockDuration:
      case cluster_id::kReferencePriority:
      case cluster_id::kReferenceBlock:
        result = start_group_value(&cursor, cluster, child.id, child.size);
        break;
      case cluster_id::kCodecState:
        result = start_codec_state(&cursor, cluster, child.size);
        break;
      default:  // BlockAdditions, Slices, Void, CRC-32, BlockVirtual, DiscardPadding, ...
        result = start_group_payload(&cursor, cluster, child.size);
        break;
    }
  }
  if (result == kClusterChildShort) {
    log_partial_header(inbuff1, inbuff2);
    return kClusterChildShort;
  }
  return result == kGoOn ? kClusterGroupEnded : result;
}
