// parse_mkvcluster: the Cluster level of the playback parser.

#include "core/cluster/block_header.h"
#include "core/cluster/cluster_ids.h"
#include "core/cluster/cluster_status.h"
#include "core/cluster/element_header.h"
#include "core/cluster/mkv_cluster.h"
#include "core/memory.h"
#include "platform/ao_log.h"

namespace {

// A child before the first block finished: the child loop goes on.
constexpr int kGoOn = 1;

bool is_block_id(uint32_t id) { return id == cluster_id::kSimpleBlock || id == cluster_id::kBlockGroup; }

bool is_child_step(mkv_resume_step step) {
  return step == mkv_resume_step::child_header || step == mkv_resume_step::child_value ||
         step == mkv_resume_step::child_payload;
}

bool is_group_step(mkv_resume_step step) {
  return step == mkv_resume_step::group_header || step == mkv_resume_step::group_value ||
         step == mkv_resume_step::group_payload || step == mkv_resume_step::codec_state;
}

uint64_t* child_value_field(mkvcluster* cluster, uint32_t id) {
  if (id == cluster_id::kTimecode) return &cluster->cluster_timecode;
  if (id == cluster_id::kPosition) return &cluster->cluster_position;
  if (id == cluster_id::kPrevSize) return &cluster->cluster_prevsize;
  return nullptr;
}

int continue_child_value(buff_cursor* cursor, mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  ebml_number_result read = ebml_continue_number(cursor, ebml_number_form::raw, 0, &resume.number);
  *child_value_field(cluster, resume.id) = resume.number.value;
  if (read == ebml_number_result::short_read) return kClusterChildShort;
  resume.number = {};
  resume.step = mkv_resume_step::none;
  return kGoOn;
}

int continue_child_payload(buff_cursor* cursor, mkvcluster* cluster) {
  mkv_cluster_resume& resume = cluster->resume;
  resume.payload_left -= cursor->skip_up_to(resume.payload_left);
  if (resume.payload_left) return kClusterChildShort;
  resume.step = mkv_resume_step::none;
  return kGoOn;
}

void open_cluster(mkvcluster* cluster, uint64_t start, uint64_t size) {
  cluster->cluster_start = start;
  cluster->cluster_size = size;
  cluster->cluster_end = element_end(start, size);
  // A BlockGroup of the last Cluster that claimed to reach further is over.
  cluster->in_blockgroup = 0;
}

// The children of a Cluster up to its first block: Timecode, Position and
// PrevSize are read; every other child's payload (CRC-32, Void, SilentTracks,
// ...) is passed over here, so that a Cluster's usual leading CRC-32 costs the
// caller no skip. A Cluster header among them starts a new Cluster: a Cluster
// cannot nest, so the one whose size claimed more is over.
int read_first_children(buff_cursor* cursor, mkvcluster* cluster, uint64_t* skip) {
  mkv_cluster_resume& resume = cluster->resume;
  int result = kGoOn;
  if (resume.step == mkv_resume_step::child_value) result = continue_child_value(cursor, cluster);
  if (resume.step == mkv_resume_step::child_payload) result = continue_child_payload(cursor, cluster);
  while (result == kGoOn) {
    if (resume.step != mkv_resume_step::child_header && cursor->position() >= cluster->cluster_end) {
      return kClusterHeaderFailed;
    }
    element_header child;
    switch (read_element_header(cursor, &resume, mkv_resume_step::child_header, &child)) {
      case header_result::short_read:
        return kClusterChildShort;
      case header_result::invalid_id:
      case header_result::invalid_size:
        AoLog(kAoLogNotice, "Sub-element of cluster is invalid, skipping.");
        continue;
      case header_result::done:
        break;
    }
    if (is_block_id(child.id)) {
      return start_newmkvblock(cursor->first, cursor->second, cluster, skip, child.id, child.size);
    }
    if (child.id == cluster_id::kCluster) {
      open_cluster(cluster, cursor->position(), child.size);
    } else if (uint64_t* field = child_value_field(cluster, child.id)) {
      *field = 0;
      if (child.size > 8) return kClusterInvalid;
      resume.id = child.id;
      resume.number = {0, static_cast<uint8_t>(child.size), static_cast<uint8_t>(child.size)};
      resume.step = mkv_resume_step::child_value;
      result = continue_child_value(cursor, cluster);
    } else {
      resume.payload_left = bytes_within(cursor->position(), cluster->cluster_end, child.size);
      resume.step = mkv_resume_step::child_payload;
      result = continue_child_payload(cursor, cluster);
    }
  }
  return result;
}

// An element met between blocks: a block, a new Cluster, or something the
// caller skips (never past the Cluster's end).
int on_cluster_level_header(buff_cursor* cursor, mkvcluster* cluster, uint64_t* skip, element_header header) {
  if (is_block_id(header.id)) {
    return start_newmkvblock(cursor->first, cursor->second, cluster, skip, header.id, header.size);
  }
  if (header.id == cluster_id::kCluster) {
    open_cluster(cluster, cursor->position(), header.size);
    return read_first_children(cursor, cluster, skip);
  }
  AoLog(kAoLogNotice, "Expected BlockGroup or SimpleBlock, got 0x%x instead, skipping %lld", header.id,
        static_cast<long long>(header.size));
  *skip = bytes_within(cursor->position(), cluster->cluster_end, header.size);
  return kClusterSkip;
}

}  // namespace

int parse_mkvcluster(mkvinbuff* inbuff1, mkvinbuff* inbuff2, mkvcluster* cluster, uint64_t* skip) {
  buff_cursor cursor{inbuff1, inbuff2};
  mkv_cluster_resume& resume = cluster->resume;
  for (;;) {
    int result;
    mkv_resume_step step = resume.step;
    if (is_block_header_step(step)) {
      result = continue_block_header(&cursor, cluster);
    } else if (is_group_step(step)) {
      result = parse_mkvblockgroup(inbuff1, inbuff2, cluster);
    } else if (is_child_step(step)) {
      result = read_first_children(&cursor, cluster, skip);
    } else if (step == mkv_resume_step::cluster_header ||
               (step == mkv_resume_step::none && cursor.position() < cluster->cluster_end)) {
      if (step == mkv_resume_step::none && cluster->in_blockgroup &&
          cursor.position() < cluster->blockgroup_end) {
        result = parse_mkvblockgroup(inbuff1, inbuff2, cluster);
      } else {
        cluster->in_blockgroup = 0;
        element_header header;
        if (read_element_header(&cursor, &resume, mkv_resume_step::cluster_header, &header) != header_result::done) {
          return kClusterHeaderFailed;
        }
        result = on_cluster_level_header(&cursor, cluster, skip, header);
        if (result == kClusterSkip) return result;
      }
    } else {
      element_header header;
      if (read_element_header(&cursor, &resume, mkv_resume_step::segment_header, &header) != header_result::done) {
        return kClusterHeaderFailed;
      }
      if (header.id != cluster_id::kCluster) {
        *skip = header.size;
        return kClusterSkip;
      }
      open_cluster(cluster, cursor.position(), header.size);
      result = read_first_children(&cursor, cluster, skip);
    }
    // A read cut by the end of the buffers goes on at the next call, wherever it lies.
    if (resume.step != mkv_resume_step::none) return result;
    if (cursor.position() < cluster->cluster_end && result != kClusterGroupEnded) return result;
  }
}

cluster_answer mkvcluster_answer(const mkvcluster* cluster, int result) {
  if (result == kClusterBlockReady || result == kClusterSkip) return cluster_answer::done;
  // Every read cut by the end of the buffers leaves its step behind; an
  // invalid byte ends the read it was in.
  const bool ran_out = cluster->resume.step != mkv_resume_step::none;
  if ((result == kClusterChildShort || result == kClusterHeaderFailed) && ran_out) return cluster_answer::need_more_data;
  return cluster_answer::error;
}

bool mkvcluster_inside_element(const mkvcluster* cluster) {
  const mkv_cluster_resume& resume = cluster->resume;
  switch (resume.step) {
    case mkv_resume_step::none:
      return false;
    case mkv_resume_step::segment_header:
    case mkv_resume_step::cluster_header:
    case mkv_resume_step::child_header:
    case mkv_resume_step::group_header:
      return resume.header_part != 0 || resume.number.left != 0;
    default:
      return true;
  }
}

