/* The built-in backends in registration order: id, name. Messages report a row's line number. */
TAVI_SCHED_BACKEND(-2, tavischedule)
TAVI_SCHED_BACKEND(-3, taviautopower)
