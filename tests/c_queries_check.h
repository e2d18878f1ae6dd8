/* The C interface's questions, asked from C. */
#ifndef FILEINDEX_TESTS_C_QUERIES_CHECK_H_
#define FILEINDEX_TESTS_C_QUERIES_CHECK_H_

#ifdef __cplusplus
extern "C" {
#endif

/* Asks the three questions of a fixed table about a folder list holding "/photo" and
 * "/video/clips", whose shares lie under `volume`, and a folder whose share is gone. Prints each
 * wrong answer to stderr and returns how many there were. */
int CheckCQueries(const char* volume);

#ifdef __cplusplus
}
#endif

#endif /* FILEINDEX_TESTS_C_QUERIES_CHECK_H_ */
