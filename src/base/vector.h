// Vector: the engine's general container, a singly linked list with a count, a tail and an
// optional ordering function. Unordered vectors are FIFO queues and registries; ordered ones
// keep records sorted and free of duplicates. Every operation except InitVector and
// GetNthElement holds the vector's entry in the resource lock table for its own duration, so a
// single operation is safe from any thread; iterations over node pointers are not.
// Nodes belong to the vector once added; payloads never do.
#pragma once

#include <cstdint>

namespace tessel {

struct VectorNode {
  std::uint64_t data = 0;
  VectorNode* next = nullptr;
};

// compare(newNode, existingNode): negative sorts the new node first, 0 means equal.
using VectorCompare = std::int8_t (*)(const VectorNode* newNode, const VectorNode* existingNode);

struct VectorProperties {
  VectorCompare compare = nullptr;
};

struct Vector {
  VectorNode* head = nullptr;
  std::int32_t count = 0;
  VectorNode* tail = nullptr;
  VectorCompare compare = nullptr;
};

// A zero-filled node carrying data; nullptr when memory is exhausted.
VectorNode* NewVectorNode(std::uint64_t data);

void InitVector(Vector* vector, const VectorProperties* properties);
bool AddElement(Vector* vector, VectorNode* node);
bool InsertElementAt(Vector* vector, VectorNode* node, std::int32_t index);
bool DeleteElement(Vector* vector, VectorNode* node);
bool DeleteElementAt(Vector* vector, std::int32_t index);
VectorNode* GetElementAt(Vector* vector, std::int32_t index);
VectorNode* GetNthElement(const Vector* vector, std::int32_t n, VectorNode* start);
int MergeVector(Vector* destination, Vector* source);
bool DeleteLCDVector(Vector* vector, std::uint64_t payload);
void FreeVector(Vector* vector);

// Removes the head node and returns its payload; false when the vector is empty.
bool TakeFirstElement(Vector* vector, std::uint64_t* payload);

}  // namespace tessel
