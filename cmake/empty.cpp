// A TA image consists of its library alone; CMake wants one source of the image's own.
