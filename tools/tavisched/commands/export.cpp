// The subcommand "export": tasks as a JSON array, as plain JSON or as the web back end exchanges
// them.
#include "commands/commands.h"
#include "failure.h"
#include "text/utf8.h"
#include "json/import.h"
#include "json/json.h"
#include "json/web.h"

namespace tavisched {

int exportTasks(const Ids &ids, bool web) {
    const Tasks tasks = Tasks::read();
    if (tasks.lacksPower() && ids.empty()) {
        throw Failure("nothing was exported, as power schedules would be missing; name the ids of "
                      "other tasks to export those");
    }
    Json::Value values(Json::arrayValue);
    for (const TAVI_SCHED_TASK *const task : tasks.select(ids)) {
        requireExchangeable(*task);
        if (!web && !isUtf8(task->command)) {
            throw Failure(called(*task) +
                          ": its command is not valid UTF-8; --web exports it, in base64");
        }
        values.append(web ? webTask(*task) : plainStored(*task));
    }
    printJson(values);
    return 0;
}

} // namespace tavisched
