// The check of one ACL file, from finding it to writing its cache.
#ifndef QZ_BULK_ACLFILE_H
#define QZ_BULK_ACLFILE_H

enum : unsigned {
    ACLFCK_OPT_COMPILE = 1,
    ACLFCK_OPT_CONTINUE = 2,
    ACLFCK_OPT_VERBOSE = 4,
    ACLFCK_OPT_STREAM = 8,
    ACLFCK_OPT_HELP = 16,
};

// Checks the file, printing each failure on standard error: on a terminal when it happens, otherwise those of lines
// gathered. `username` may be null; of the
// flags, compile, continue and verbose have an effect. Returns the exit status of the command.
int aclfck__bulk_aclfile(const char *aclfname, const char *username, unsigned flags);

// Stands for a check that does not hold the whole file in memory; it does nothing and returns 0.
int aclfck__stream_aclfile(const char *aclfname, const char *username);

// Sets memory aside for printing an error when there is no other left; called once, at the start.
void aclfck__keep_spare_memory();

// Prints the current error and an empty line, at once.
void aclfck__print_error();

#endif
