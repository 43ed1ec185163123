#include "core/header/ebml_read.h"
#include "core/header/element_handlers.h"
#include "core/memory.h"
#include "core/status.h"
#include "platform/ao_log.h"

namespace {

constexpr uint32_t kSeekId = 0x4DBB;
constexpr uint32_t kSeekIdId = 0x53AB;
constexpr uint32_t kSeekPositionId = 0x53AC;

void free_seek_list(mkv_queue* list) {
  mkv_queue_node* node = list->head;
  for (uint32_t i = 0; i < list->count && node; ++i) {
    mkv_queue_node* next = node->next;
    mem_free(node->data);
    mem_free(node);
    node = next;
  }
  *list = mkv_queue{};
}

// Bubble sort by position over the nodes' entry pointers. Equal positions are
// never swapped, so they keep their file order.
void sort_by_position(mkv_queue* list) {
  bool swapped = true;
  while (swapped) {
    swapped = false;
    mkv_queue_node* node = list->head;
    for (uint32_t i = 1; i < list->count && node && node->next; ++i, node = node->next) {
      auto* first = static_cast<mkv_seek_entry*>(node->data);
      auto* second = static_cast<mkv_seek_entry*>(node->next->data);
      if (first->seek_position > second->seek_position) {
        node->data = second;
        node->next->data = first;
        swapped = true;
      }
    }
  }
}

int append_seek_entry(mkv_queue* list, mkv_seek_entry** current) {
  auto* entry = mem_new_zeroed<mkv_seek_entry>();
  if (!entry) {
    AoLog(kAoLogNotice, "Can't allocate new seek entry.");
    return kStatusNoMemory;
  }
  if (!mkv_queue_append(list, entry)) {
    AoLog(kAoLogNotice, "Can't allocate new queue entry.");
    mem_free(entry);
    return kStatusNoMemory;
  }
  *current = entry;
  return kStatusOk;
}

}  // namespace

int mkv_meta_seek_handler(mkv_file_info* info, mkvvstream* stream, uint32_t*, uint64_t* size) {
  uint64_t end = ebml_end_of(mkvvstream_tell(stream), *size);
  // Only list 0 steers the walk; SeekHeads beyond the record's room are ignored.
  if (info->seek_head_count < 0 || info->seek_head_count >= kMaxSeekLists) {
    (void)mkvvstream_seek(stream, end);
    return kStatusOk;
  }
  mkv_queue* list = &info->seek_lists[info->seek_head_count];
  *list = mkv_queue{};
  mkv_seek_entry* current = nullptr;

  // Damage to the element's structure (`damage`) drops the SeekHead and lets
  // the walk go on; a bad value or an exhausted heap ends the walk.
  int damage = kStatusOk;
  while (damage == kStatusOk && mkvvstream_tell(stream) < end) {
    uint32_t child = 0;
    uint64_t child_size = 0;
    damage = ebml_read_id(stream, &child);
    if (damage == kStatusOk) damage = ebml_read_size(stream, &child_size);
    if (damage != kStatusOk) break;

    int status = kStatusOk;
    if (child == kSeekId) {
      status = append_seek_entry(list, &current);  // the Seek's children follow in this loop
    } else if (child == kSeekIdId && current) {
      current->seek_id = 0;
      // The stored ID's own length marker decides how many bytes it takes.
      if (child_size > 8) status = kStatusMalformed;
      else damage = ebml_read_id(stream, &current->seek_id);
    } else if (child == kSeekPositionId && current) {
      status = ebml_read_uint(stream, child_size, &current->seek_position);
    } else {
      damage = ebml_skip(stream, child_size);
    }
    if (status != kStatusOk) {
      free_seek_list(list);
      return status;
    }
  }

  if (list->count == 0) return kStatusOk;
  if (damage != kStatusOk) {
    free_seek_list(list);
    (void)mkvvstream_seek(stream, end);
    return kStatusOk;
  }
  sort_by_position(list);
  info->parse_flags |= kMetSeekHead;
  ++info->seek_head_count;
  return kStatusOk;
}
