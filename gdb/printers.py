"""How gdb shows the library's values: texts and identifiers as text, buffers as their bytes, shared pointers as what they
point to, commits, trees and blobs as what a reader of a history wants to know.

Installed as share/gdb/auto-load/PATH-OF-THE-LIBRARY-gdb.py, where gdb finds it by itself if the library is installed below /usr.
Otherwise: `source .../printers.py`. Everything is read from memory and nothing is called, so that core dumps work too. What
only the library knows the layout of, the bytes of buffers and the entries of trees, needs its debug information.
"""

import datetime

import gdb
import gdb.printing

SHOWN_BYTES = 200
UNKNOWN = "without debug information of the library"
ID_STATE_SET = 2


def member(value, *names):
    """The first of the members that the value, or a base class of it, has: standard libraries name theirs differently."""
    for name in names:
        try:
            return value[name]
        except gdb.error:
            continue
    raise gdb.error("no member " + " or ".join(names))


def has_member(value, name):
    try:
        return value[name] is not None
    except gdb.error:
        return False


def atomic_value(atomic):
    """The value of a std::atomic."""
    inner = member(atomic, "_M_b", "_M_i", "__a_")
    if inner.type.strip_typedefs().code == gdb.TYPE_CODE_STRUCT:
        inner = member(inner, "_M_p", "_M_i", "__a_value")
    return inner


def array_bytes(array):
    elements = member(array, "_M_elems", "__elems_")
    low, high = elements.type.strip_typedefs().range()
    return bytes(int(elements[index]) for index in range(low, high + 1))


def read_bytes(address, size):
    return bytes(gdb.selected_inferior().read_memory(address, size)) if size > 0 else b""


def find_type(name):
    """The type, or None where there is no debug information of it."""
    try:
        return gdb.lookup_type(name)
    except gdb.error:
        return None


def characters_of(string):
    """Pointer and length of a KivStringT or KivStringViewT."""
    unit = string.type.strip_typedefs().template_argument(0)
    if has_member(string, "length_"):
        return string["text_"], int(string["length_"])
    text = string["text_"]["object_"]
    if int(text) == 0:
        return text.cast(unit.pointer()), 0
    return (text + 1).cast(unit.pointer()), int(text["length"])


def text_of(string):
    """The text as a Python string; what is not well-formed as a replacement character."""
    pointer, length = characters_of(string)
    wide = pointer.type.target().sizeof == 2
    content = read_bytes(int(pointer), length * (2 if wide else 1))
    return content.decode("utf-16-le" if wide else "utf-8", "replace")


def id_of(identifier):
    """The text of an Id; None for the null identifier."""
    if identifier["isDigest_"]:
        return array_bytes(identifier["digest_"]).hex()
    text = atomic_value(identifier["text_"]["value_"]["word_"])
    if int(text) == 0:
        return None
    if find_type("KivVcs::Id::Text") is None:
        return "a text that is no digest"
    return text_of(text.dereference()["text"])


def known_id_of(thing):
    """The identifier that an object has computed already; None otherwise."""
    cached = thing["id_"]
    if int(atomic_value(cached["state_"]["word_"])) < ID_STATE_SET:
        return None
    return array_bytes(cached["digest_"]).hex()


def named(kind, thing):
    identifier = known_id_of(thing)
    return "%s %s" % (kind, identifier[:12] if identifier else "(not identified yet)")


class Buffers:
    """Size and bytes of a buffer."""

    def __init__(self, buffer):
        self.content = buffer["content_"]["object_"]
        self.known = find_type("KivUtils::Memory::Buffer::Block") is not None

    def size(self):
        """In bytes; None without debug information."""
        if int(self.content) == 0:
            return 0
        return int(self.content["size"]) if self.known else None

    def chunks(self):
        """Address and size of each."""
        if not self.known or int(self.content) == 0:
            return
        kind = str(self.content["kind"]).rpartition("::")[2]
        if kind != "Chain":
            block = self.content.cast(gdb.lookup_type("KivUtils::Memory::Buffer::%sBlock" % kind.replace("Block", "")).pointer())
            yield int(block["bytes"] if kind == "Adopted" else block + 1), self.size()
            return
        chain = self.content.cast(gdb.lookup_type("KivUtils::Memory::Buffer::Chain").pointer())
        for piece in elements_of(chain["chunks"]):
            extent = member(piece, "_M_extent", "__size_")
            if extent.type.strip_typedefs().code == gdb.TYPE_CODE_STRUCT:
                extent = extent["_M_extent_value"]
            yield int(member(piece, "_M_ptr", "__data_")), int(extent)

    def __str__(self):
        size = self.size()
        if size is None:
            return "bytes, " + UNKNOWN
        shown = b""
        for address, length in self.chunks():
            shown += read_bytes(address, min(length, SHOWN_BYTES - len(shown)))
            if len(shown) == SHOWN_BYTES:
                break
        quoted = "".join(chr(byte) if 32 <= byte < 127 and byte not in b'"\\' else "\\%03o" % byte for byte in shown)
        return '%d bytes "%s"%s' % (size, quoted, "..." if size > len(shown) else "")


def elements_of(vector):
    """The elements of a std::vector."""
    ends = member(vector, "_M_impl") if has_member(vector, "_M_impl") else vector
    element, end = member(ends, "_M_start", "__begin_"), member(ends, "_M_finish", "__end_")
    while element != end:
        yield element.dereference()
        element += 1


def pointee_of(pointer):
    """What a cow_ptr points to; None for null."""
    counted = pointer["counted_"]["object_"]
    if int(counted) == 0:
        return None
    held = pointer.type.strip_typedefs().template_argument(0).strip_typedefs()
    if is_derived(held, "KivPlatform::reference_counted"):
        thing = counted.cast(held.const().pointer()).dereference()
        return thing.cast(thing.dynamic_type) if is_derived(thing.dynamic_type, str(held)) else thing
    holder = counted.cast(gdb.lookup_type("KivUtils::object_holder").pointer()).dereference()
    thing = holder.cast(holder.dynamic_type)["object_"]
    return thing if thing.type.strip_typedefs().unqualified() == held.unqualified() else member_of_pointer(thing)


def member_of_pointer(unique):
    """What a std::unique_ptr points to."""
    return gdb.default_visualizer(unique).children().__next__()[1].dereference()


def is_derived(derived, base_name):
    derived = derived.strip_typedefs().unqualified()
    if derived.name == base_name:
        return True
    if derived.code != gdb.TYPE_CODE_STRUCT:
        return False
    return any(is_derived(field.type, base_name) for field in derived.fields() if field.is_base_class)


class TextPrinter:
    def __init__(self, value):
        self.value = value

    def to_string(self):
        pointer, length = characters_of(self.value)
        return pointer.lazy_string(length=length) if length > 0 else ""

    def display_hint(self):
        return "string"


class IdPrinter:
    def __init__(self, value):
        self.value = value

    def to_string(self):
        return id_of(self.value) or "no object"


class BufferPrinter:
    def __init__(self, value):
        self.value = value

    def to_string(self):
        return str(Buffers(self.value))


class PointerPrinter:
    def __init__(self, value):
        self.value = value

    def to_string(self):
        counted = self.value["counted_"]["object_"]
        if int(counted) == 0:
            return "null"
        owners = int(atomic_value(counted["references_"]))
        return "held %s" % ("once" if owners == 1 else "%d times" % owners)

    def children(self):
        try:
            thing = pointee_of(self.value)
        except gdb.error:
            thing = UNKNOWN
        if thing is not None:
            yield "object", thing


class TimePrinter:
    """Ticks of 100 nanoseconds since 1970."""

    def __init__(self, value):
        self.value = value

    def to_string(self):
        ticks = int(self.value["ticks_"])
        if ticks >= 2**63:
            ticks -= 2**64
        try:
            moment = datetime.datetime(1970, 1, 1) + datetime.timedelta(microseconds=ticks // 10)
            return moment.isoformat(sep=" ") + " UTC"
        except OverflowError:
            return "%d ticks" % ticks


class ObjectPrinter:
    """Of what only the library's debug information describes."""

    def __new__(cls, value):
        try:
            known_id_of(value)
        except gdb.error:
            return UnknownPrinter(value)
        return super().__new__(cls)


class UnknownPrinter:
    def __init__(self, value):
        self.value = value

    def to_string(self):
        return UNKNOWN


class BlobPrinter(ObjectPrinter):
    def __init__(self, value):
        self.value = value

    def to_string(self):
        return "%s, %s" % (named("blob", self.value), Buffers(self.value["data_"]))


class CommitPrinter(ObjectPrinter):
    def __init__(self, value):
        self.value = value

    def to_string(self):
        return named("commit", self.value)

    def children(self):
        for name in ("description_", "authorName_", "authorEmail_", "commitTime_"):
            yield name, self.value[name]
        parent = pointee_of(self.value["parent_"])
        yield "parent_", named("commit", parent) if parent is not None else "none"
        yield "tree_", self.value["tree_"]


class CommitTreePrinter:
    def __init__(self, value):
        self.value = value

    def to_string(self):
        return "the files of a commit" if int(self.value["root_"]["counted_"]["object_"]) else "no files"

    def children(self):
        root = pointee_of(self.value["root_"])
        if root is not None:
            yield "root_", root


class TreePrinter(ObjectPrinter):
    """A directory by its names, each with what it holds."""

    def __init__(self, value):
        self.top = value["entries_"]["top_"]
        self.name = named("tree", value)

    def to_string(self):
        return self.name

    def children(self):
        if find_type("KivVcs::detail::Entry") is not None:
            for entry in entries_below(self.top):
                yield text_of(entry["name"]), "; ".join(held_by(entry["held"]["word_"]))


def entries_below(handle):
    """The entries below a node, in order."""
    node = handle["counted_"]["object_"].cast(gdb.lookup_type("KivVcs::detail::Node").pointer())
    if int(node) == 0:
        return
    kind = "Entry" if int(node["height_"]) == 0 else "Child"
    elements = (node + 1).cast(gdb.lookup_type("KivVcs::detail::" + kind).pointer())
    for index in range(int(node["count_"])):
        if kind == "Entry":
            yield elements[index]
        else:
            yield from entries_below(elements[index]["node"])


def held_by(word):
    """What a name holds, by the lowest bits of the address: a blob, a tree, or both."""
    kind, address = int(word) & 3, int(word) & ~3
    if kind == 3:
        both = gdb.Value(address).cast(gdb.lookup_type("KivVcs::detail::Held::Both").pointer())
        yield named_or_null("blob", pointee_of(both["blob"]))
        yield named_or_null("tree", pointee_of(both["tree"]))
    else:
        thing = gdb.Value(address).cast(gdb.lookup_type("KivVcs::Object").pointer())
        yield named_or_null("blob" if kind == 1 else "tree", thing.dereference() if address else None)


def named_or_null(kind, thing):
    return "null " + kind if thing is None else named(kind, thing)


def make_printers():
    printers = gdb.printing.RegexpCollectionPrettyPrinter("KivVcs")
    for name, pattern, printer in (
        ("KivStringT", "^KivPlatform::KivStringT<.*>$", TextPrinter),
        ("KivStringViewT", "^KivPlatform::KivStringViewT<.*>$", TextPrinter),
        ("Id", "^KivVcs::Id$", IdPrinter),
        ("Buffer", "^KivUtils::Memory::Buffer$", BufferPrinter),
        ("cow_ptr", "^KivUtils::cow_ptr<.*>$", PointerPrinter),
        ("Time", "^KivUtils::Time$", TimePrinter),
        ("Blob", "^KivVcs::Blob$", BlobPrinter),
        ("Tree", "^KivVcs::Tree$", TreePrinter),
        ("CommitTree", "^KivVcs::CommitTree$", CommitTreePrinter),
        ("Commit", "^KivVcs::Commit$", CommitPrinter),
    ):
        printers.add_printer(name, pattern, printer)
    return printers


gdb.printing.register_pretty_printer(gdb.current_objfile(), make_printers(), replace=True)
