// Range reads, writes and deletions on a vector, by (start, stop, step) triples and by two indices.
// One adjustment rule clamps the triple to the vector; reads whose start lies at or beyond the end
// start at the first element, writes and deletions start at the end.
#pragma once

#include <algorithm>
#include <cstdio>
#include <memory>
#include <stdexcept>
#include <vector>

#include "runtime/runtime.h"

namespace client3 {

using Index = Py_ssize_t;

struct Range {
  Index ii = 0, jj = 0;
};

// (i, j, step) against n elements; `insert` is true for writing and deleting.
inline Range Adjust(Index i, Index j, Index step, Index n, bool insert) {
  Range r;
  if (step == 0) throw std::invalid_argument("slice step cannot be zero");
  if (step > 0) {
    if (i < 0)
      r.ii = 0;
    else if (i < n)
      r.ii = i;
    else if (insert)
      r.ii = n;
    r.jj = j < 0 ? 0 : std::min(j, n);
    if (r.jj < r.ii) r.jj = r.ii;
  } else {
    r.ii = i < -1 ? -1 : i < n ? i : n - 1;
    r.jj = j < -1 ? -1 : j < n ? j : n - 1;
    if (r.ii < r.jj) r.ii = r.jj;
  }
  return r;
}

// The number of positions a stepped range covers: ii, ii + step, ... short of jj.
inline Index StepCount(const Range& r, Index step) {
  Index span = step > 0 ? r.jj - r.ii : r.ii - r.jj;
  Index stride = step > 0 ? step : -step;
  return span <= 0 ? 0 : 1 + (span - 1) / stride;
}

template <class V>
V* GetSlice(const V& v, Index i, Index j, Index step) {
  Index n = static_cast<Index>(v.size());
  Range r = Adjust(i, j, step, n, false);
  if (step == 1) return new V(v.begin() + r.ii, v.begin() + r.jj);
  auto out = std::make_unique<V>();
  Index count = StepCount(r, step);
  out->reserve(count);
  for (Index k = 0, at = r.ii; k < count; ++k, at += step) out->push_back(v[at]);
  return out.release();
}

template <class V>
void SetSlice(V& v, Index i, Index j, Index step, const V& source) {
  // A vector assigned into itself is read from a copy, so that growing it cannot move its source.
  if (&source == &v) {
    const V copy(source);
    return SetSlice(v, i, j, step, copy);
  }
  Index n = static_cast<Index>(v.size());
  Range r = Adjust(i, j, step, n, true);
  Index size = static_cast<Index>(source.size());
  if (step == 1) {
    Index m = r.jj - r.ii;
    if (m <= size) {
      v.reserve(n - m + size);
      std::copy(source.begin(), source.begin() + m, v.begin() + r.ii);
      v.insert(v.begin() + r.jj, source.begin() + m, source.end());
    } else {
      v.erase(v.begin() + r.ii, v.begin() + r.jj);
      v.insert(v.begin() + r.ii, source.begin(), source.end());
    }
    return;
  }
  Index count = StepCount(r, step);
  if (size != count) {
    char message[1024];
    std::snprintf(message, sizeof message, "attempt to assign sequence of size %lu to extended slice of size %lu",
                  static_cast<unsigned long>(size), static_cast<unsigned long>(count));
    throw std::invalid_argument(message);
  }
  for (Index k = 0, at = r.ii; k < count && at >= 0 && at < n; ++k, at += step) v[at] = source[k];
}

// Removes the positions ii, ii + step, ... short of jj, as they were before the deletion.
template <class V>
void DeleteSlice(V& v, Index i, Index j, Index step) {
  Index n = static_cast<Index>(v.size());
  Range r = Adjust(i, j, step, n, true);
  if (step == 1) {
    v.erase(v.begin() + r.ii, v.begin() + r.jj);
    return;
  }
  Index count = StepCount(r, step);
  if (count == 0) return;
  // The removed positions, lowest first; the kept elements close up in one pass.
  Index stride = step > 0 ? step : -step;
  Index low = step > 0 ? r.ii : r.ii - (count - 1) * stride;
  Index high = low + (count - 1) * stride;
  Index write = low;
  for (Index read = low; read < n; ++read) {
    bool removed = read <= high && (read - low) % stride == 0;
    if (!removed) v[write++] = std::move(v[read]);
  }
  v.erase(v.begin() + write, v.end());
}

// `__delslice__`: both indices clamped to [0, n]; never throws.
template <class V>
void DeleteIndexRange(V& v, Index i, Index j) {
  Index n = static_cast<Index>(v.size());
  Index ii = std::clamp<Index>(i, 0, n), jj = std::clamp<Index>(j, 0, n);
  v.erase(v.begin() + ii, v.begin() + std::max(ii, jj));
}

// The triple of a slice object against n elements: missing values take their defaults, a negative
// start or stop has n added once, and nothing is clamped (the adjustment rule does that). Values
// beyond the index range are held at a bound far outside any vector.
inline bool SliceTriple(PyObject* slice, Index n, Index& start, Index& stop, Index& step) {
  constexpr Index far = Index(1) << 40;
  auto read = [](PyObject* o, Index& out) {
    if (!PyLong_Check(o)) {
      PyErr_SetString(PyExc_TypeError, "slice indices must be integers or None");
      return false;
    }
    int overflow = 0;
    long long value = PyLong_AsLongLongAndOverflow(o, &overflow);
    if (overflow) value = overflow > 0 ? far : -far;
    out = static_cast<Index>(std::clamp<long long>(value, -far, far));
    return true;
  };
  auto* s = reinterpret_cast<PySliceObject*>(slice);
  step = 1;
  if (s->step != Py_None && !read(s->step, step)) return false;
  if (s->start == Py_None) {
    start = step < 0 ? n - 1 : 0;
  } else {
    if (!read(s->start, start)) return false;
    if (start < 0) start += n;
  }
  if (s->stop == Py_None) {
    stop = step < 0 ? -1 : n;
  } else {
    if (!read(s->stop, stop)) return false;
    if (stop < 0) stop += n;
  }
  return true;
}

}  // namespace client3
