#pragma once

/// @file
/// What is to be stored, on its way into archives on disks and servers.

#include "Segment.h"

namespace KivArchive {

/// Something to be stored: an object, or a piece of a content.
struct Item {
    Id id;
    StoredType type = StoredType::Blob;
    /// The size of `data`, or of the content that `data` lists the pieces of.
    std::uint64_t size = 0;
    Buffer data;
    Id earlier;
};

/// What is made of an item.
struct ItemForm {
    Item const* item = nullptr;
    Member member;
    /// The stored form: compact where that can be, otherwise the data itself, which the item keeps.
    Bytes compact;
    ByteView form;
};

/// Makes the form of an item, as that of a member that shares a frame.
void MakeForm(ItemForm& made);

} // namespace KivArchive
