# Writes a copy of a source file with one piece of text replaced: the lab's
# tests build a deliberately broken module from it, to show that the sweep
# catches the fault. Fails when the text is gone, so the mutation cannot go
# stale without notice.
file(READ ${INPUT} text)
string(FIND "${text}" "${FROM}" at)
if(at EQUAL -1)
  message(FATAL_ERROR "${INPUT} no longer holds \"${FROM}\": bring the mutation up to date")
endif()
string(REPLACE "${FROM}" "${TO}" text "${text}")
file(WRITE ${OUTPUT} "${text}")
