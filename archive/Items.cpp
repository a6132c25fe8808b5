#include "Items.h"

#include "Changes.h"
#include "CompactForms.h"

namespace KivArchive {

void MakePackedForm(ItemForm& made) {
    Item const& item = *made.item;
    made.form = BytesOf(item.data);
    made.member.type = item.type;
    made.member.size = item.size;
    made.member.formSize = made.form.size();
    made.member.encoding = Encoding::Shared;
}

void MakeForm(ItemForm& made) {
    MakePackedForm(made);
    Item const& item = *made.item;
    if (item.type != StoredType::Tree && item.type != StoredType::Commit)
        return;
    auto compact = item.type == StoredType::Tree ? CompactTree(made.form) : CompactCommit(made.form);
    if (!compact)
        return;
    made.compact = std::move(*compact);
    made.form = made.compact;
    made.member.isCompact = true;
    made.member.formSize = made.form.size();
}

} // namespace KivArchive
