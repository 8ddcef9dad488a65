// edit: an editor on the file.
#include "cli.h"
#include "edit_answer.h"
#include "edit_session.h"
#include "text_edit.h"

#include <chrono>

namespace qzacl {

int edit(const call &call) {
    edited_file file = file_to_edit(call);
    require_text({file.path(), file.text()});
    const bool has_changed = edit_session(file, call.permissions, std::chrono::seconds(call.line.wait)).run();
    return answer_edit(call, file, has_changed);
}

} // namespace qzacl
