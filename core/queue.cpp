#include "core/queue.h"

#include "core/memory.h"

mkv_queue_node* mkv_new_queue_entry(void* data, mkv_queue* list) {
  auto* node = mem_new_zeroed<mkv_queue_node>();
  if (!node) return nullptr;
  node->data = data;
  if (!list->head) list->head = node;
  if (list->tail) list->tail->next = node;
  list->tail = node;
  return node;
}

bool mkv_queue_append(mkv_queue* queue, void* data) {
  if (!mkv_new_queue_entry(data, queue)) return false;
  ++queue->count;
  return true;
}
