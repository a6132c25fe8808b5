#pragma once

/// @file
/// What is to be stored, on its way into archives on disks and servers.

#include "Segment.h"

namespace KivArchive {

/// Something to be stored: an object, or a piece of a content.
struct Item {
    Id id;
    StoredType type = StoredType::Blob;
    /// The size of the data that it is, or stands for.
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

/// Makes the form of an item; its member is one of a shared frame.
void MakeForm(ItemForm& made);

} // namespace KivArchive
