#include "platform/value/Array.h"

#include "platform/value/InternalInconsistency.h"
#include "platform/value/ValueNodes.h"

namespace platform {

Array::Array(std::initializer_list<Value> items) : Array(std::vector<Value>(items)) {}
Array::Array(std::vector<Value> items) : value_(ValueAccess::array(std::move(items))) {}
Array::Array(const Value& value) : value_(value.isArray() ? value : Value()) {}

std::vector<Value>& Array::writable() {
  if (value_.isNothing()) {
    value_ = ValueAccess::array({});
  } else if (value_.payload_.node->references.load(std::memory_order_acquire) != 1) {
    value_ = ValueAccess::array(std::vector<Value>(items().begin(), items().end()));
  }
  return static_cast<ArrayNode*>(value_.payload_.node)->items;
}

void Array::reserve(std::size_t capacity) {
  writable().reserve(capacity);
}

void Array::append(Value value) {
  writable().push_back(std::move(value));
}

void Array::set(std::size_t index, Value value) {
  if (index >= size()) throw InternalInconsistency("an element beyond the end of an array was set");
  writable()[index] = std::move(value);
}

}  // namespace platform
