#pragma once

/// @file
/// What is to be stored in a database, a file's or a server's.

#include "Segment.h"

namespace KivArchive {

/// An object, or a piece of a content, to be stored.
struct Item {
    Id id;
    StoredType type = StoredType::Blob;
    /// The size of `data`, or of the content whose pieces `data` lists.
    std::uint64_t size = 0;
    Buffer data;
    Id earlier;
};

/// An item with its stored form.
struct ItemForm {
    Item const* item = nullptr;
    Member member;
    /// The bytes of `form` if it is compact; otherwise it is the item's data.
    Bytes compact;
    ByteView form;
};

/// Makes the form of `made.item`, for a member that shares the frame of its segment: a compact one of trees and commits.
void MakeForm(ItemForm& made);
/// The same, but always the item's data, which is as it is packed.
void MakePackedForm(ItemForm& made);

} // namespace KivArchive
