// The six vector types: 34 module functions each, from one template over the element type.
#include <cstddef>
#include <iterator>
#include <memory>
#include <new>
#include <stdexcept>
#include <type_traits>
#include <vector>

#include "containers/dispatch.h"
#include "containers/iterators.h"
#include "containers/sequence.h"
#include "containers/slices.h"
#include "runtime/wrap.h"

namespace client3 {

namespace {

template <class T, Text Function>
constexpr auto FunctionName = cat(ElementTraits<T>::prefix, "_", Function);

// The overload message of a member function, each prototype behind "std::vector< T >::".
template <class T, Text Function, Text... Prototypes>
constexpr auto OverloadsOf = OverloadMessage<FunctionName<T, Function>, cat(ContainerName<T>, "::", Prototypes)...>;

template <bool Condition, Text A, Text B>
constexpr auto Pick() {
  if constexpr (Condition)
    return A;
  else
    return B;
}

// A size or capacity as an int object.
struct Count {
  std::size_t n;
};
PyObject* ToPython(Count c) {
  return c.n < 0x80000000u ? PyLong_FromLong(static_cast<long>(c.n)) : PyLong_FromUnsignedLong(c.n);
}

// ---- Argument kinds ---------------------------------------------------------------------------

// The vector itself. Overload dispatch tests it the way it tests any container argument.
template <class T, class Base>
struct VectorSelf : Base {
  static bool check(PyObject* o) { return AsVector<T>(o, nullptr) >= 0; }
};

// The vector together with the script object it came from, for results that keep it alive.
template <class V>
struct Held {
  V* v;
  PyObject* object;
};
template <class T, class Base>
struct HeldSelf : VectorSelf<T, Base> {
  PyObject* object = nullptr;
  int load(PyObject* o) {
    object = o;
    return Base::load(o);
  }
  auto get() const { return Held{Base::get(), object}; }
};

// A text element: an owning SafeString; anything but str and bytes is refused.
template <Text Type>
struct TextElement {
  static constexpr auto type = Type;
  static constexpr bool reference = false;
  SafeString value;
  int load(PyObject* o) {
    int code = AsSafeString(o, &value);
    if (code != ErrTypeError) return code;
    PyErr_SetString(PyExc_TypeError, "Expected string type");
    return Raised;
  }
  static bool check(PyObject* o) { return AsSafeString(o, nullptr) >= 0; }
  const SafeString& get() const { return value; }
};

// An argument that overload dispatch does not test: the form is chosen by the others, and this one
// reports its own failure when converted.
template <class K>
struct Unchecked : K {
  static bool check(PyObject*) { return true; }
};

template <class T, Text Type>
using ValueArg = std::conditional_t<std::is_same_v<T, SafeString>, TextElement<Type>,
                                    ScalarKind<T, Type, ElementTraits<T>::convert>>;

struct SliceArg {
  static constexpr Text type = "PySliceObject *";
  static constexpr bool reference = false;
  static constexpr bool typeTested = true;
  PyObject* value = nullptr;
  int load(PyObject* o) {
    if (Py_TYPE(o) != &PySlice_Type) {
      PyErr_SetString(PyExc_TypeError, "Slice object expected.");
      return Raised;
    }
    value = o;
    return ResultOk;
  }
  static bool check(PyObject* o) { return Py_TYPE(o) == &PySlice_Type; }
  PyObject* get() const { return value; }
};

// An iterator argument: any open or closed iterator over this instance's forward positions. The
// iterator is not moved; its position is what the operation uses. Overload dispatch only asks for
// an iterator, so that one of the wrong kind is reported against its own argument.
template <class V, Text Type>
struct PositionArg {
  static constexpr auto type = Type;
  static constexpr bool reference = false;
  typename V::iterator value{};
  int load(PyObject* o) {
    void* pointer = nullptr;
    if (ConvertProxy(o, &pointer, TypeFor<swig::SwigPyIterator>(), 0) < 0 || !pointer) return ErrTypeError;
    auto* at = dynamic_cast<swig::SwigPyIterator_T<typename V::iterator>*>(static_cast<swig::SwigPyIterator*>(pointer));
    if (!at) return ErrTypeError;
    value = at->get_current();
    return ResultOk;
  }
  static bool check(PyObject* o) {
    void* pointer = nullptr;
    return ConvertProxy(o, &pointer, TypeFor<swig::SwigPyIterator>(), 0) >= 0 && pointer;
  }
  typename V::iterator get() const { return value; }
};

// ---- The family -------------------------------------------------------------------------------

template <class T>
struct Vector {
  using V = std::vector<T>;
  using It = typename V::iterator;
  using RevIt = std::reverse_iterator<It>;
  static constexpr bool packed = std::is_same_v<T, bool>;
  static constexpr bool text = std::is_same_v<T, SafeString>;

  // Spellings.
  static constexpr auto C = ContainerName<T>;
  static constexpr auto Difference = cat(C, "::difference_type");
  static constexpr auto SizeType = cat(C, "::size_type");
  // An element is named `value_type` in argument messages; the prototypes take it by const
  // reference, except the packed bits, which are handed over by value.
  static constexpr auto ElementType = cat(C, "::value_type");
  static constexpr auto ValueType = Pick<packed, ElementType, cat(ElementType, " const &")>();
  static constexpr auto IteratorType = cat(C, "::iterator");
  // A whole vector: the slice assignments name the allocator form, the copy constructor its own.
  static constexpr auto Source = cat(AllocatorName<T>, " const &");
  static constexpr auto Original = cat(C, " const &");
  static constexpr auto IndexConst = Pick<packed, Text{""}, Text{" const"}>();
  static constexpr auto NewName = cat("new_", ElementTraits<T>::prefix);

  // Kinds.
  using Self = VectorSelf<T, Pointer<V, cat(C, " *")>>;
  using ConstSelf = VectorSelf<T, Pointer<const V, cat(C, " const *")>>;
  using HeldMut = HeldSelf<T, Pointer<V, cat(C, " *")>>;
  using HeldConst = HeldSelf<T, Pointer<const V, cat(C, " const *")>>;
  using IndexSelf = std::conditional_t<packed, HeldMut, HeldConst>;
  using Diff = ScalarKind<int, Difference, AsInt>;
  using Size = ScalarKind<unsigned int, SizeType, AsUnsignedInt>;
  // Every instance names its element argument `value_type`, the string one too: its element is a
  // class that the prototypes take by const reference, but an argument message names the declared
  // type alone, and a text element that is refused says "Expected string type" (or leaves its
  // encoding error pending) without naming any type. Nothing sets it apart from the others.
  using Value = ValueArg<T, ElementType>;
  using Seq = SequenceArg<T>;
  using Copied = SequenceValue<T, Original>;
  using Ref = Pointer<V, cat(C, " &")>;
  using Pos = PositionArg<V, IteratorType>;

  using Closed = swig::SwigPyIteratorClosed_T<It, T>;
  using Open = swig::SwigPyIteratorOpen_T<It, T>;
  using ReverseOpen = swig::SwigPyIteratorOpen_T<RevIt, T>;
  using Iterator = Owned<swig::SwigPyIterator>;

  static Iterator OpenAt(V* v, It at) { return {new Open(at, {v})}; }

  // An element handed out in place: a SafeString proxy that keeps the vector's object alive, or
  // the value of any other element.
  static PyObject* Element(const Held<const V>& s, typename V::const_reference e) {
    if constexpr (text) {
      PyObject* proxy = NewPointerObj(nullptr, const_cast<SafeString*>(&e), TypeFor<SafeString>(), 0);
      if (proxy && PyObject_SetAttr(proxy, ContainerOwnerAttribute(), s.object) < 0) PyErr_Clear();
      return proxy;
    } else {
      return client3::ToPython(static_cast<T>(e));
    }
  }
  template <class W>
  static Held<const V> AsConst(const Held<W>& s) {
    return {s.v, s.object};
  }

  static std::size_t Position(const V& v, Index i) {
    Index n = static_cast<Index>(v.size());
    if (i < 0 ? -i <= n : i < n) return static_cast<std::size_t>(i < 0 ? i + n : i);
    throw std::out_of_range("index out of range");
  }
  // Iterator arguments must lie inside this vector (at most at its end when `end` is allowed).
  static It Inside(V& v, It at, bool end) {
    auto offset = at - v.begin();
    if (offset < 0 || offset > static_cast<Index>(v.size()) || (!end && offset == static_cast<Index>(v.size())))
      throw std::out_of_range("index out of range");
    return at;
  }
  // The library runs in a 32-bit process: a vector that could not fit in its address space is
  // refused as exhausted memory rather than attempted.
  static unsigned int Room(unsigned int n, std::size_t more = 0) {
    std::size_t total = n + more;
    if ((packed ? total / 8 : total * sizeof(T)) > 0x7fffffffu) throw std::bad_alloc();
    return n;
  }
  static void Triple(PyObject* slice, const V& v, Index& start, Index& stop, Index& step) {
    if (!SliceTriple(slice, static_cast<Index>(v.size()), start, stop, step)) throw Pending();
  }

  // Targets.
  static constexpr auto iterator = [](Held<V> s) {
    return Iterator{new Closed(s.v->begin(), s.v->begin(), s.v->end(), {s.v}, s.object)};
  };
  static constexpr auto nonzero = [](const V* v) { return !v->empty(); };
  static constexpr auto size = [](const V* v) { return Count{v->size()}; };
  static constexpr auto getslice = [](V* v, int i, int j) { return Owned<V>{GetSlice(*v, i, j, 1)}; };
  static constexpr auto clearslice = [](V* v, int i, int j) { SetSlice(*v, i, j, 1, V()); };
  static constexpr auto setslice = [](V* v, int i, int j, const V& s) { SetSlice(*v, i, j, 1, s); };
  static constexpr auto delslice = [](V* v, int i, int j) { DeleteIndexRange(*v, i, j); };
  static constexpr auto delitemSlice = [](V* v, PyObject* slice) {
    Index start, stop, step;
    Triple(slice, *v, start, stop, step);
    DeleteSlice(*v, start, stop, step);
  };
  static constexpr auto delitem = [](V* v, int i) { v->erase(v->begin() + Position(*v, i)); };
  static constexpr auto getitemSlice = [](V* v, PyObject* slice) {
    Index start, stop, step;
    Triple(slice, *v, start, stop, step);
    return Owned<V>{GetSlice(*v, start, stop, step)};
  };
  static constexpr auto getitem = [](auto s, int i) { return Element(AsConst(s), (*s.v)[Position(*s.v, i)]); };
  static constexpr auto setitemSlice = [](V* v, PyObject* slice, const V& source) {
    Index start, stop, step;
    Triple(slice, *v, start, stop, step);
    SetSlice(*v, start, stop, step, source);
  };
  static constexpr auto setitem = [](V* v, int i, const T& x) { (*v)[Position(*v, i)] = x; };
  static constexpr auto pop = [](V* v) {
    if (v->empty()) throw std::out_of_range("pop from empty container");
    T last = v->back();
    v->pop_back();
    return last;
  };
  static constexpr auto append = [](V* v, const T& x) { v->push_back(x); };
  static constexpr auto swap = [](V* v, V* other) { v->swap(*other); };
  static constexpr auto begin = [](V* v) { return OpenAt(v, v->begin()); };
  static constexpr auto end = [](V* v) { return OpenAt(v, v->end()); };
  static constexpr auto rbegin = [](V* v) { return Iterator{new ReverseOpen(v->rbegin(), {v})}; };
  static constexpr auto rend = [](V* v) { return Iterator{new ReverseOpen(v->rend(), {v})}; };
  static constexpr auto clear = [](V* v) { v->clear(); };
  static constexpr auto allocator = [](const V* v) {
    return Owned<typename V::allocator_type>{new typename V::allocator_type(v->get_allocator())};
  };
  // An empty vector has no last element to remove: nothing is done.
  static constexpr auto pop_back = [](V* v) {
    if (!v->empty()) v->pop_back();
  };
  static constexpr auto erase = [](V* v, It at) { return OpenAt(v, v->erase(Inside(*v, at, false))); };
  static constexpr auto eraseRange = [](V* v, It first, It last) {
    Inside(*v, first, true);
    Inside(*v, last, true);
    if (last < first) throw std::out_of_range("index out of range");
    return OpenAt(v, v->erase(first, last));
  };
  static constexpr auto make = [] { return Owned<V, PointerOwn | PointerNoShadow>{new V()}; };
  static constexpr auto copy = [](V s) { return Owned<V, PointerOwn | PointerNoShadow>{new V(std::move(s))}; };
  static constexpr auto sized = [](unsigned int n) { return Owned<V, PointerOwn | PointerNoShadow>{new V(Room(n))}; };
  static constexpr auto filled = [](unsigned int n, const T& x) {
    return Owned<V, PointerOwn | PointerNoShadow>{new V(Room(n), x)};
  };
  // front and back of an empty vector raise IndexError rather than read outside it.
  static constexpr auto front = [](Held<const V> s) {
    if (s.v->empty()) throw std::out_of_range("index out of range");
    return Element(s, s.v->front());
  };
  static constexpr auto back = [](Held<const V> s) {
    if (s.v->empty()) throw std::out_of_range("index out of range");
    return Element(s, s.v->back());
  };
  static constexpr auto assign = [](V* v, unsigned int n, const T& x) { v->assign(Room(n), x); };
  static constexpr auto resize = [](V* v, unsigned int n) { v->resize(Room(n)); };
  static constexpr auto resizeFilled = [](V* v, unsigned int n, const T& x) { v->resize(Room(n), x); };
  static constexpr auto insert = [](V* v, It at, const T& x) { return OpenAt(v, v->insert(Inside(*v, at, true), x)); };
  static constexpr auto insertMany = [](V* v, It at, unsigned int n, const T& x) {
    v->insert(Inside(*v, at, true), Room(n, v->size()), x);
  };
  static constexpr auto reserve = [](V* v, unsigned int n) { v->reserve(Room(n)); };
  static constexpr auto capacity = [](const V* v) { return Count{v->capacity()}; };

  template <auto Target>
  static constexpr auto G = Guarded<Target, ContainerErrors>;

  template <Text Function, Convention Conv, auto Target, class... K>
  using F = Fn<FunctionName<T, Function>, Conv, G<Target>, K...>;
  template <auto Target, class... K>
  using Form = client3::Form<G<Target>, K...>;

  using Functions = Table<
      F<"iterator", Object, iterator, HeldMut>,
      F<"__nonzero__", Object, nonzero, ConstSelf>,
      F<"__bool__", Object, nonzero, ConstSelf>,
      F<"__len__", Object, size, ConstSelf>,
      F<"__getslice__", Tuple, getslice, Self, Diff, Diff>,
      Overloaded<FunctionName<T, "__setslice__">,
                 OverloadsOf<T, "__setslice__", cat("__setslice__(", Difference, ",", Difference, ")"),
                         cat("__setslice__(", Difference, ",", Difference, ",", Source, ")")>,
                 Form<clearslice, Self, Diff, Diff>, Form<setslice, Self, Diff, Diff, Seq>>,
      F<"__delslice__", Tuple, delslice, Self, Diff, Diff>,
      Overloaded<FunctionName<T, "__delitem__">,
                 OverloadsOf<T, "__delitem__", cat("__delitem__(", Difference, ")"), Text{"__delitem__(PySliceObject *)"}>,
                 Form<delitemSlice, Self, SliceArg>, Form<delitem, Self, Diff>>,
      Overloaded<FunctionName<T, "__getitem__">,
                 OverloadsOf<T, "__getitem__", Text{"__getitem__(PySliceObject *)"},
                         cat("__getitem__(", Difference, ")", IndexConst)>,
                 Form<getitemSlice, Self, SliceArg>, Form<getitem, IndexSelf, Diff>>,
      Overloaded<FunctionName<T, "__setitem__">,
                 OverloadsOf<T, "__setitem__", cat("__setitem__(PySliceObject *,", Source, ")"),
                         Text{"__setitem__(PySliceObject *)"}, cat("__setitem__(", Difference, ",", ValueType, ")")>,
                 Form<setitemSlice, Self, SliceArg, Seq>, Form<delitemSlice, Self, SliceArg>,
                 // The element is converted before the index is tested, so a bad element is reported
                 // as argument 3 whatever the index.
                 Form<setitem, Self, Diff, Unchecked<Value>>>,
      F<"pop", Object, pop, Self>,
      F<"append", Tuple, append, Self, Value>,
      F<"empty", Object, [](const V* v) { return v->empty(); }, ConstSelf>,
      F<"size", Object, size, ConstSelf>,
      F<"swap", Tuple, swap, Self, Ref>,
      F<"begin", Object, begin, Self>,
      F<"end", Object, end, Self>,
      F<"rbegin", Object, rbegin, Self>,
      F<"rend", Object, rend, Self>,
      F<"clear", Object, clear, Self>,
      F<"get_allocator", Object, allocator, ConstSelf>,
      F<"pop_back", Object, pop_back, Self>,
      Overloaded<FunctionName<T, "erase">,
                 OverloadsOf<T, "erase", cat("erase(", IteratorType, ")"), cat("erase(", IteratorType, ",", IteratorType, ")")>,
                 Form<erase, Self, Pos>, Form<eraseRange, Self, Pos, Pos>>,
      Overloaded<NewName,
                 OverloadMessage<NewName, cat(C, "::vector()"), cat(C, "::vector(", Original, ")"),
                                 cat(C, "::vector(", SizeType, ")"), cat(C, "::vector(", SizeType, ",", ValueType, ")")>,
                 Form<make>, Form<copy, Copied>, Form<sized, Size>, Form<filled, Size, Value>>,
      F<"push_back", Tuple, append, Self, Value>,
      F<"front", Object, front, HeldConst>,
      F<"back", Object, back, HeldConst>,
      F<"assign", Tuple, assign, Self, Size, Value>,
      Overloaded<FunctionName<T, "resize">,
                 OverloadsOf<T, "resize", cat("resize(", SizeType, ")"), cat("resize(", SizeType, ",", ValueType, ")")>,
                 Form<resize, Self, Size>, Form<resizeFilled, Self, Size, Value>>,
      Overloaded<FunctionName<T, "insert">,
                 OverloadsOf<T, "insert", cat("insert(", IteratorType, ",", ValueType, ")"),
                         cat("insert(", IteratorType, ",", SizeType, ",", ValueType, ")")>,
                 Form<insert, Self, Pos, Value>, Form<insertMany, Self, Pos, Size, Value>>,
      F<"reserve", Tuple, reserve, Self, Size>,
      F<"capacity", Object, capacity, ConstSelf>,
      Register<ElementTraits<T>::prefix, TypeOf<V>>,
      Init<ElementTraits<T>::prefix>>;
};

constexpr auto kVectorFunctions =
    Join(Vector<bool>::Functions::defs, Vector<double>::Functions::defs, Vector<float>::Functions::defs,
         Vector<int>::Functions::defs, Vector<unsigned long long>::Functions::defs, Vector<SafeString>::Functions::defs);

}  // namespace

std::span<const PyMethodDef> VectorFunctions() { return kVectorFunctions; }

}  // namespace client3
