// The home of the precompiled test headers: a target needs one source file.
