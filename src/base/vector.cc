#include "base/vector.h"

#include <new>

#include "base/resource_lock.h"

namespace tessel {
namespace {

// Holds the vector's resource lock for one operation.
class VectorLock {
 public:
  explicit VectorLock(const Vector* vector) : key_(vector) { LockResource(key_); }
  ~VectorLock() { UnlockResource(key_); }
  VectorLock(const VectorLock&) = delete;
  VectorLock& operator=(const VectorLock&) = delete;

 private:
  const void* key_;
};

// Unlinks the node after `previous` (the head when previous is null). Caller holds the lock.
void UnlinkAfter(Vector* vector, VectorNode* previous) {
  VectorNode* node = previous ? previous->next : vector->head;
  if (previous) {
    previous->next = node->next;
  } else {
    vector->head = node->next;
  }
  if (vector->tail == node) vector->tail = previous;
  delete node;
  vector->count -= 1;
}

void LinkAfter(Vector* vector, VectorNode* previous, VectorNode* node) {
  if (previous) {
    node->next = previous->next;
    previous->next = node;
  } else {
    node->next = vector->head;
    vector->head = node;
  }
  if (node->next == nullptr) vector->tail = node;
  vector->count += 1;
}

// Binary search by comparisons over the sorted list; false when an equal node exists.
bool InsertOrdered(Vector* vector, VectorNode* node) {
  std::int32_t lo = 0;
  std::int32_t hi = vector->count;
  VectorNode* current = vector->head;
  VectorNode* upper = nullptr;
  while (hi - lo > 1) {
    std::int32_t mid = lo + (hi - lo + 1) / 2;
    VectorNode* probe = GetNthElement(vector, mid - lo, current);
    std::int8_t c = vector->compare(node, probe);
    if (c == 0) return false;
    if (c > 0) {
      lo = mid;
      current = probe;
    } else {
      hi = mid;
      upper = probe;
    }
  }
  std::int8_t c = vector->compare(node, current);
  if (c == 0) return false;
  if (c < 0) {
    LinkAfter(vector, nullptr, node);
    return true;
  }
  if (upper == nullptr) upper = current->next;
  if (upper == nullptr || vector->compare(node, upper) < 0) {
    LinkAfter(vector, current, node);
  } else {
    if (vector->compare(node, upper) == 0) return false;
    LinkAfter(vector, upper, node);
  }
  return true;
}

}  // namespace

VectorNode* NewVectorNode(std::uint64_t data) {
  VectorNode* node = new (std::nothrow) VectorNode{};
  if (node) node->data = data;
  return node;
}

void InitVector(Vector* vector, const VectorProperties* properties) {
  vector->head = nullptr;
  vector->count = 0;
  vector->tail = nullptr;
  vector->compare = properties ? properties->compare : nullptr;
}

bool AddElement(Vector* vector, VectorNode* node) {
  VectorLock lock(vector);
  node->next = nullptr;
  if (vector->head == nullptr) {
    vector->head = vector->tail = node;
    vector->count += 1;
    return true;
  }
  if (vector->compare == nullptr) {
    vector->tail->next = node;
    vector->tail = node;
    vector->count += 1;
    return true;
  }
  return InsertOrdered(vector, node);
}

bool InsertElementAt(Vector* vector, VectorNode* node, std::int32_t index) {
  VectorLock lock(vector);
  if (index < 0 || index > vector->count) return false;
  VectorNode* previous = nullptr;
  for (std::int32_t i = 0; i < index; ++i) previous = previous ? previous->next : vector->head;
  LinkAfter(vector, previous, node);
  return true;
}

bool DeleteElement(Vector* vector, VectorNode* node) {
  VectorLock lock(vector);
  if (vector->head == nullptr) return false;
  VectorNode* previous = nullptr;
  for (VectorNode* at = vector->head; at; previous = at, at = at->next) {
    if (at == node) {
      UnlinkAfter(vector, previous);
      break;
    }
  }
  return true;
}

bool DeleteElementAt(Vector* vector, std::int32_t index) {
  VectorLock lock(vector);
  if (index < 0 || index >= vector->count) return false;
  VectorNode* previous = nullptr;
  for (std::int32_t i = 0; i < index; ++i) previous = previous ? previous->next : vector->head;
  UnlinkAfter(vector, previous);
  return true;
}

VectorNode* GetElementAt(Vector* vector, std::int32_t index) {
  VectorLock lock(vector);
  if (index < 0 || index >= vector->count) return nullptr;
  VectorNode* node = vector->head;
  for (std::int32_t i = 0; i < index && node; ++i) node = node->next;
  return node;
}

VectorNode* GetNthElement(const Vector* vector, std::int32_t n, VectorNode* start) {
  if (n < 0 || n >= vector->count || vector->head == nullptr) return nullptr;
  VectorNode* node = start;
  for (std::int32_t i = 0; i < n && node; ++i) node = node->next;
  return node;
}

int MergeVector(Vector* destination, Vector* source) {
  for (std::int32_t i = 0;; ++i) {
    VectorNode* from = GetElementAt(source, i);
    if (from == nullptr) break;
    VectorNode* copy = NewVectorNode(from->data);
    if (copy == nullptr) return 99;
    if (!AddElement(destination, copy)) delete copy;
  }
  FreeVector(source);
  return 1;
}

bool DeleteLCDVector(Vector* vector, std::uint64_t payload) {
  std::int32_t position = -1;
  {
    VectorLock lock(vector);
    std::int32_t i = 0;
    for (VectorNode* node = vector->head; node; node = node->next, ++i) {
      if (node->data == payload) {
        position = i;
        break;
      }
    }
  }
  if (position < 0) return false;
  return DeleteElementAt(vector, position);
}

void FreeVector(Vector* vector) {
  VectorLock lock(vector);
  while (vector->head) {
    VectorNode* node = vector->head;
    vector->head = node->next;
    delete node;
  }
  vector->tail = nullptr;
  vector->count = 0;
}

bool TakeFirstElement(Vector* vector, std::uint64_t* payload) {
  VectorLock lock(vector);
  if (vector->head == nullptr) return false;
  *payload = vector->head->data;
  UnlinkAfter(vector, nullptr);
  return true;
}

}  // namespace tessel
