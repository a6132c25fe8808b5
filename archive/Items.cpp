#include "Items.h"

#include "Changes.h"
#include "CompactForms.h"

namespace KivArchive {

void MakeForm(ItemForm& made) {
    Item const& item = *made.item;
    ByteView const data = BytesOf(item.data);
    made.form = data;
    if (item.type == StoredType::Tree || item.type == StoredType::Commit) {
        auto compact = item.type == StoredType::Tree ? CompactTree(data) : CompactCommit(data);
        made.member.isCompact = compact.has_value();
        if (compact) {
            made.compact = std::move(*compact);
            made.form = made.compact;
        }
    }
    made.member.type = item.type;
    made.member.size = item.size;
    made.member.formSize = made.form.size();
    made.member.encoding = Encoding::Shared;
}

} // namespace KivArchive
