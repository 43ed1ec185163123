#pragma once
// A counted, singly linked list with a tail pointer. Nodes are appended at the
// tail and walked from the head; nothing is removed except by freeing the
// whole list, which walks exactly `count` nodes.

#include <cstdint>

struct mkv_queue_node {
  void* data;  // the entry record, owned by the list
  mkv_queue_node* next;
};

struct mkv_queue {
  uint32_t count;  // always the number of nodes: a failed append leaves it unchanged
  mkv_queue_node* head;
  mkv_queue_node* tail;
};

// Appends a node carrying `data`, touching only the list's head and tail.
// Returns the node, or null when the heap is exhausted (list unchanged). The
// caller increments `count` once the node is added.
[[nodiscard]] mkv_queue_node* mkv_new_queue_entry(void* data, mkv_queue* list);

// Appends `data` and counts it. False when the heap is exhausted; the caller
// still owns `data` then.
[[nodiscard]] bool mkv_queue_append(mkv_queue* queue, void* data);
