/*
 * The library from C: saves a task from a JSON file, and shows a stored task with its last run.
 *
 *   task save FILE      stores the task that the file describes and prints its id
 *   task show ID        prints name, next run and last result
 *
 * Build: cc task.c -o task $(pkg-config --cflags --libs tavischeduler)
 */
#include <platc.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <tavischeduler.h>

static int fail(const char *what) {
    fprintf(stderr, "task: %s: error 0x%04X (%s:%d)\n", what, PLATCErrGet(), PLATCErrorGetFile(),
            PLATCErrorGetLine());
    return 1;
}

static int save(const char *path) {
    static char json[160 * 1024];
    FILE *file = fopen(path, "r");
    int32_t id = -1;
    if (!file) {
        perror(path);
        return 1;
    }
    json[fread(json, 1, sizeof json - 1, file)] = '\0';
    fclose(file);
    id = TAVISchedTaskSaveFromJson(json, 0);
    if (id < 0) {
        return fail("the task cannot be saved");
    }
    printf("%ld\n", (long)id);
    return 0;
}

static const char *resultName(int32_t code) {
    static const char *const names[] = {
        "none",        "interrupted",       "running",          "success",
        "not started", "stopped by signal", "killed by signal", "exit code"};
    return code >= 0 && code < 8 ? names[code] : "unknown";
}

static int show(int32_t id) {
    TAVI_SCHED_TASK *task = TAVISchedTaskAlloc();
    struct sqlite3 *db = NULL; /* stays so when there were no runs yet */
    int32_t code = SCHED_STATUS_CODE_NONE;
    char comment[16] = "";
    int result = 1;
    if (!task || TAVISchedDBOpenForReading(&db) < 0 || TAVISchedTaskGetByID(id, task) != 0) {
        fail("the task cannot be read");
    } else {
        printf("name:     %s\nnext run: %s\n", task->name, task->nextTriggerTime);
        if (db) {
            TAVISchedDBGetStatusByTaskID(db, id, NULL, &code, comment, sizeof comment);
        }
        printf("last run: %s %s\n", resultName(code), comment);
        result = 0;
    }
    if (db) {
        TAVISchedDBClose(db);
    }
    if (task) {
        TAVISchedTaskFree(task);
    }
    return result;
}

int main(int argc, char **argv) {
    if (argc == 3 && strcmp(argv[1], "save") == 0) {
        return save(argv[2]);
    }
    if (argc == 3 && strcmp(argv[1], "show") == 0) {
        return show((int32_t)atoi(argv[2]));
    }
    fprintf(stderr, "usage: task save FILE | task show ID\n");
    return 2;
}
