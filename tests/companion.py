"""A minimal stand-in for the companion script module: one script class per wrapped class.

Each class passes itself to its `_swigregister` function, names its `delete_` function as
`__swig_destroy__`, and (when the class has a `new_` function) attaches the new proxy to the
instance through its `_swiginit` function, as the real companion module does.
"""
import _Client3

classes = {}


def _make_class(name):
    namespace = {}
    destroy = getattr(_Client3, "delete_" + name, None)
    if destroy is not None:
        namespace["__swig_destroy__"] = destroy
    new = getattr(_Client3, "new_" + name, None)
    if new is not None:
        init = getattr(_Client3, name + "_swiginit")

        def __init__(self, *args):
            init(self, new(*args))

        namespace["__init__"] = __init__
    return type(name, (object,), namespace)


def register():
    """Registers a class for every `_swigregister` function the module has (once)."""
    for attribute in dir(_Client3):
        if attribute.endswith("_swigregister"):
            name = attribute[: -len("_swigregister")]
            if name not in classes:
                classes[name] = _make_class(name)
                getattr(_Client3, attribute)(classes[name])
    return classes
