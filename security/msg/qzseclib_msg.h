// The default texts of message set 1 of the catalog qzseclib.cat, in id order, with one source line per line of
// text, so that every line feed is visible. The message table, the catalog source for translators and the checks of
// message arguments are all made from this list.
#ifndef QZSECLIB_MSG_H
#define QZSECLIB_MSG_H

#include <array>
#include <cstddef>
#include <string_view>

namespace qz::msg {

struct text_entry {
    int id;
    const char *text;
};

inline constexpr char catalog_name[] = "qzseclib.cat";
inline constexpr int catalog_set = 1;
inline constexpr int table_size = 623;

// clang-format off
inline constexpr text_entry texts[] = {
    {80,
     "Syntax:\n"
     "\tqzaclfck [-c] [-s] [-u <username>] [-v] -f <ACL file name>\n"
     "or, for help:\n"
     "\tqzaclfck -h\n"},
    {81,
     "qzaclfck: Checks an ACL file for syntactical validity.\n"
     "Syntax:\n"
     "\tqzaclfck [-c] [-s] [-u <username>] [-v] -f <ACL file name>\n"
     "or, for help:\n"
     "\tqzaclfck -h\n"
     "\n"
     "Options:\n"
     "\t -c \t Continues the checking until the end of the file, treating\n"
     "\t    \t errors as warnings.  The default behavior is to stop on the\n"
     "\t    \t first error, however, by providing this flag, the routine will\n"
     "\t    \t not attempt error recovery.\n"
     "\t -f \t This option specifies the name of the ACL file.  If the ACL\n"
     "\t    \t file name does not start with a leading '/', then it is\n"
     "\t    \t treated as relative to the current directory.\n"
     "\t -h \t Displays this help message.\n"
     "\t -s \t This option instructs the command to compile the contents of\n"
     "\t    \t the ACL file into an ACL buffer and save it in a cache ACL\n"
     "\t    \t The cache ACL file will have the same name as the original ACL\n"
     "\t    \t file, but with an added extension of \".cacl\".  The ownership\n"
     "\t    \t and file permissions will be the same as the original ACL file.\n"
     "\t    \t This option has no effect if specified with the '-u' option.\n"
     "\t -u \t This option specifies the name of the user who owns the ACL\n"
     "\t    \t file.  If this option is specified together with option '-s',\n"
     "\t    \t the command displays a warning message and no cache ACL file\n"
     "\t    \t will be produced.  Also, when this option is specified, the ACL\n"
     "\t    \t file must reside in the user's home directory.\n"
     "\t -v \t This option specifies the verbose mode in which case the\n"
     "\t    \t command displays the entries in the ACL file.\n"},
    {82,
     "The ACL provided is not valid!\n"},
    {83,
     "ACL descriptor: %1$s byte(s) long\n"
     "\tVersion: %2$d\n"
     "\tByte Ordering: %3$d\n"
     "\tNumber of sub-ACLs: %4$d\n"},
    {84,
     "%1$sSubacl:\n"
     "%2$s(length = %3$d byte(s); type = %4$d; mech = %5$s; ACLE count = %6$d)\n"},
    {85,
     "%1$stype = %2$c; mech = %3$s; id = %4$s; permission = %5$s\n"},
    {86,
     "%1$stype = %2$c; id = %3$s; permission = %4$s\n"},
    {87,
     "%1$stype = %2$c; permission = %3$s\n"},
    {88,
     "3417-101 Failure: incorrect parameters provided.\n"
     "\tFunction name: %1$s\n"
     "\tPositional parameter number: %2$d\n"
     "\tParameter value: 0x%3$x\n"
     "If this failure is encountered during the execution of the Cluster software\n"
     "trusted services, contact Korvane Customer Support and report this incident.\n"
     "If this failure is encountered during the execution of other software,\n"
     "verify that the software is using this function correctly.\n"},
    {89,
     "3417-102 Failure: Memory allocation failure.\n"
     "\tFunction name: %1$s\n"
     "\tAttempted allocation: %2$d bytes\n"
     "Most often, this failure occurs when a process exceeds its memory allocation\n"
     "limit.  In rare cases, this failure occurs when a number of processes\n"
     "allocate huge amounts of memory and utilize all available memory on the\n"
     "system.  Verify that the allocation itself is not exceeding its own limit.\n"
     "If a Cluster software trusted service is exceeding its limit, contact Korvane\n"
     "Customer Support and report this incident.  If another software application\n"
     "is exceeding its limit, examine the software for memory management problems\n"
     "and memory leaks.  If the application is not exceeding its memory allocation\n"
     "limits, contact the system administrator and report this incident.  System\n"
     "administrators should identify processes using excessive memory and consider\n"
     "terminating these processes.\n"},
    {91,
     "3417-104 Internal failure detected.\n"
     "\tFile name: %1$s\n"
     "\tLine number: %2$d\n"
     "\tError code: %3$d\n"
     "Contact Korvane Customer Support and report this incident.\n"},
    {93,
     "3417-106 Failure: The access control list provided to this\n"
     "routine is either incorrect or corrupted.  It is possible that the application\n"
     "has inadvertantly overwritten the variable containing the address of the\n"
     "access control list, ot the application may have inadvertantly overwritten\n"
     "the memory used to store the access control list.  Verify that the application\n"
     "is providing the correct address for the access control list to this routine.\n"
     "Perform memory leak and memory use verification tests on the application to\n"
     "ensure that the application is not inadvertantly modifying this memory.\n"},
    {94,
     "3417-107 Failure: The type of the access control entry\n"
     "(ACLE) provided to this routine (%1$d) is of a wrong or unknown type.  This\n"
     "routine accepts only an ACLE of type 'user' or 'group'. It is possible that\n"
     "the application has inadvertantly overwritten the variable passed to the\n"
     "routine as the ACLE argument.  Verify that the application is providing the\n"
     "correct type of ACLE to this routine.  Perform memory leak and memory use\n"
     "verification tests on the application to ensure that the application is not\n"
     "inadvertantly modifying this memory.\n"},
    {95,
     "3417-108 Failure: The access control entry (ACLE) provided to this\n"
     "routine does not have a valid mechanism mnomonic or identifier. An ACLE of\n"
     "type 'user' or 'expanded' must have both a valid mechanism mnemonic an a\n"
     "valid identifier.  An ACLE of type of type 'group' must have a valid identifier.\n"
     "It is possible that the application has inadvertantly overwritten the variable\n"
     "passed to the routine as the ACLE argument.  Perform memory leak and memory\n"
     "use verification tests on the application to ensure that the application\n"
     "is not inadvertantly modifying this memory.\n"},
    {96,
     "3417-109 Failure: The access control (ACL) buffer provided\n"
     "to this routine does not appear to be a valid ACL buffer.  It is possible\n"
     "that the application has inadvertantly overwritten the variable passed to\n"
     "the routine as the ACL argument.  Perform memory leak and memory use\n"
     "verification tests on the application to ensure that the application is not\n"
     "inadvertantly modifying this memory.\n"},
    {97,
     "3417-110 Failure: The access control (ACL) buffer provided\n"
     "to this routine appears to be corrupted.  It is possible that the application\n"
     "has inadvertantly overwritten the value of the ACL buffer.  Perform memory\n"
     "leak and memory use verification tests on the application to ensure that\n"
     "the application is not inadvertantly modifying this memory.\n"
     "(%1$s:%2$d)\n"},
    {98,
     "3417-111 Failure: The access control list (ACL) buffer/file\n"
     "provided to this routine appears to be corrupted.  In any ACL, there can\n"
     "be only one ACL entry (ACLE) of type 'unauthenticated' or 'anyother'.  It\n"
     "is possible that the application has inadvertantly overwritten the value\n"
     "of the ACL buffer or that the ACL file is corrupted.  Perform memory leak\n"
     "and memory use verification tests on the application to ensure that the application\n"
     "is not inadvertantly modifying the memory use for the ACL buffer.  In case\n"
     "of an ACL file make sure that there is only one such entry in the file.\n"},
    {100,
     "3417-113 Failure: The buffer provided by the caller for\n"
     "the second argument is not a valid ACL buffer (type).  It is possible that\n"
     "the application provided the wrong buffer to the routine or that it has\n"
     "inadvertantly overwritten the ACL buffer.  Make sure that the application\n"
     "is providing the correct variable to the routine and perform memory leak\n"
     "and memory use verification tests on the application to ensure that the\n"
     "application is not inadvertantly modifying this memory.\n"},
    {101,
     "3417-114 Failure: The ACL buffer provided by the caller\n"
     "for the second argument does not have a supported version.  Valid ACL buffer\n"
     "versions are version 1.  It is possible that the application provided the\n"
     "wrong ACL buffer to the routine or that it has inadvertantly overwritten\n"
     "the ACL buffer.  Make sure that the application is providing the correct\n"
     "variable to the routine and perform memory leak and memory use verification\n"
     "tests on the application to ensure that the application is not inadvertantly\n"
     "modifying this memory.\n"},
    {102,
     "3417-115 Failure: The ACL buffer provided by the caller\n"
     "for the second argument does not have the correct byte ordering for the \n"
     "machine.  Please ensure that the application converts the ACL buffer to\n"
     "the machine's byte ordering by calling sec_convert_acl_tohost before providing\n"
     "the ACL buffer to this routine.  It is also possible that the application\n"
     "has inadvertantly overwritten the ACL buffer.  Make sure that the application\n"
     "converts the ACL buffer to the machine's byte ordering and perform memory\n"
     "leak and memory use verification tests on the application to ensure that\n"
     "it is not inadvertantly modifying this memory.\n"},
    {103,
     "3417-116 Failure: The type of the access control entry\n"
     "(ACLE) provided to this routine (%1$d) is of a wrong or unknown type.  Valid\n"
     "ACLE types are 'unauthenticated' (1), 'anyother' (2), 'user' (3), and 'group'\n"
     "(4). It is possible that the application has inadvertantly overwritten the\n"
     "variable passed to the routine as the ACLE argument.  Verify that the application\n"
     "is providing the correct type of ACLE to this routine.  Perform memory leak\n"
     "and memory use verification tests on the application to ensure that the application\n"
     "is not inadvertantly modifying this memory.\n"},
    {104,
     "3417-117 Failure: The type of the access control entry\n"
     "(ACLE) provided to this routine (%1$d) requires either a valid mechanism\n"
     "mnemonic or an identifier, or both.  It is possible that the application\n"
     "has inadvertantly overwritten the variable passed to the routine as the ACLE\n"
     "argument.  Perform memory leak and memory use verification tests on the application\n"
     "to ensure that the application is not inadvertantly modifying this memory.\n"},
    {105,
     "3417-118 Failure: The access control list (ACL) provided\n"
     "to the routine does not contain an access control list entry (ACLE) that\n"
     "matches the type (%1$d), the mechanism (%2$s), and the identifier (%3$s)\n"
     "of the ACLE provided.\n"},
    {106,
     "3417-119 Failure: The access control list (ACL) provided\n"
     "is not valid.  Its length (%1$d) is smaller than the size of an ACL buffer\n"
     "header.  It is also possible that the application has inadvertantly overwritten\n"
     "the ACL buffer.  Please perform memory leak and memory use verification tests\n"
     "on the application to ensure that it is not inadvertantly modifying this\n"
     "memory.\n"
     "(%2$s:%3$d)\n"},
    {107,
     "3417-120 Failure: The type of access control list entries\n"
     "(ACLEs) in the current sub-ACL (%1$d) is of a wrong or unknown type.  Valid\n"
     "ACLE types are 'unauthenticated' (1), 'anyother' (2), 'user' (3), and 'group'\n"
     "(4). It is possible that the application has inadvertantly overwritten the\n"
     "variable that contains the ACL buffer.  Verify that the application is providing\n"
     "the correct type of ACLE to this routine.  Perform memory leak and memory\n"
     "use verification tests on the application to ensure that the application\n"
     "is not inadvertantly modifying this memory.\n"
     "(%2$s:%3$d)\n"},
    {108,
     "3417-121 Failure: The type of access control list entries\n"
     "(ACLEs) in the current sub-ACL (%1$d) should not contain any mechanism. It\n"
     "is possible that the application has inadvertantly overwritten the variable\n"
     "that contains the ACL buffer.  Verify that the application is providing\n"
     "the correct type of ACLE to this routine.  Perform memory leak and memory\n"
     "use verification tests on the application to ensure that the application\n"
     "is not inadvertantly modifying this memory.\n"
     "(%2$s:%3$d)\n"},
    {109,
     "3417-122 Failure: An access control list (ACL) can have\n"
     "at most one entry of type 'unauthenticated' or 'anyother' each.  It is\n"
     "possible that the application has inadvertantly overwritten the variable\n"
     "that contains the ACL buffer.  Perform memory leak and memory use verification\n"
     "tests on the application to ensure that the application is not inadvertantly\n"
     "modifying this memory.\n"
     "(%1$s:%2$d)\n"},
    {110,
     "3417-123 Failure: The access control list (ACL) provided\n"
     "contains a 'user' sub-ACL with an incorrect length for the mechanism mnemonic: %1$d.\n"
     "The length of the mechanism mnemonic must be greater than 1 and less or equal\n"
     "than 16 bytes. It is possible that the application has inadvertantly overwritten\n"
     "the variable that contains the ACL buffer.  Perform memory leak and memory\n"
     "use verification tests on the application to ensure that the application\n"
     "is not inadvertantly modifying this memory.\n"
     "(%2$s:%3$d)\n"},
    {111,
     "3417-124 Failure: The access control list (ACL) provided\n"
     "contains a 'user' sub-ACL with an incorrect mechanism mnemonic: %1$s.\n"
     "The length of the mechanism mnemonic must be greater than 1 and less or equal\n"
     "than 16 bytes.\n"
     "It is possible that the application has inadvertantly overwritten the variable\n"
     "that contains the ACL buffer.  Perform memory leak and memory use verification\n"
     "tests on the application to ensure that the application is not inadvertantly\n"
     "modifying this memory.\n"
     "(%2$s:%3$d)\n"},
    {112,
     "3417-125 Failure: The access control list (ACL) contains\n"
     "contains an access control list entry (ACLE) with a version that is not supported\n"
     "by the ACL library (%1$d).  It is possible that the application has inadvertantly\n"
     "overwritten the variable that contains the ACL buffer.  Perform memory leak\n"
     "and memory use verification tests on the application to ensure that the application\n"
     "is not inadvertantly modifying this memory.\n"
     "(%2$s:%3$d)\n"},
    {113,
     "3417-126 Failure:  The access control list (ACL) contains\n"
     "an access control list entry (ACLE) of type 'unauthenticated' or 'anyother'\n"
     "that has an identifier with length greater than zero (0).  These types of\n"
     "ACLEs do not contain identifiers and the presence of an identifier in such\n"
     "and ACLE indicates a problem.  It is possible that the application has inadvertantly\n"
     "overwritten the variable that contains the ACL buffer.  Perform memory leak\n"
     "and memory use verification tests on the application to ensure that the application\n"
     "is not inadvertantly modifying this memory.\n"
     "(%1$s:%2$d)\n"},
    {114,
     "3417-127 Failure:  The access control list (ACL) contains\n"
     "an access control list entry (ACLE) of type 'user' or 'group' that has an\n"
     "incorrect identifier: the length of the identifier in the ACLE does not match\n"
     "the length of the identifier string.  It is possible that the application\n"
     "has inadvertantly overwritten the variable that contains the ACL buffer.\n"
     "Perform memory leak and memory use verification tests on the application\n"
     "to ensure that the application is not inadvertantly modifying this memory.\n"
     "(%1$s:%2$d)\n"},
    {115,
     "3417-128 Failure: The type of the access control entry\n"
     "(ACLE) provided to this routine (%1$d) is of a wrong or unknown type.  This\n"
     "routine accepts only an ACLE types of 'unauthenticated', 'anyother', and\n"
     "'user'. It is possible that the application has inadvertantly overwritten\n"
     "the variable passed to the routine as the ACLE type argument.  Verify that\n"
     "the application is providing the correct type of ACLE to this routine.\n"
     "Perform memory leak and memory use verification tests on the application\n"
     "to ensure that the application is not inadvertantly modifying this memory.\n"},
    {116,
     "3417-129 Failure: The type of the access control entry\n"
     "(ACLE) provided to this routine requires a valid mechanism mnemonic that\n"
     "is not NULL or empty string.  It is possible that the application has inadvertantly \n"
     "overwritten the variable passed to the routine as the mechanism mnemonic\n"
     "argument.  Verify that the application is providing the correct mechanism\n"
     "mnemonic to the routine. Perform memory leak and memory use verification\n"
     "tests on the application to ensure that the application is not inadvertantly\n"
     "modifying this memory.\n"},
    {117,
     "3417-130 Failure: The type of the access control entry\n"
     "(ACLE) provided to this routine requires a valid identifier that is not NULL\n"
     "or empty string.  It is possible that the application has inadvertantly\n"
     "overwritten the variable passed to the routine as the mechanism mnemonic\n"
     "argument.  Verify that the application is providing the correct mechanism\n"
     "mnemonic to the routine. Perform memory leak and memory use verification\n"
     "tests on the application to ensure that the application is not inadvertantly\n"
     "modifying this memory.\n"},
    {118,
     "3417-131 Internal failure: The ACL library is unable to\n"
     "lock/unlock the internal state data.  This failure is unexpected an may occur\n"
     "because of a programming error or memory violation.  Perform memory leak\n"
     "and memory use verification tests on the application to ensure that the\n"
     "application is not inadvertantly modifying the memory use for the internal\n"
     "state.  If there are no memory violation, contact Korvane's Customer Service.\n"
     "(%1$s:%2$d, %3$d)\n"},
    {119,
     "3417-132 Failure: The mechanism mnemonic provided to\n"
     "the routine for the first argument is not valid.  It is either an empty string\n"
     "or its length is greater than the maximum allowed of 16 bytes.  Please provide\n"
     "a valid mechanism mnemonic to the routine.\n"},
    {121,
     "3417-134 Failure: The username provided is not valid.\n"
     "A valid user name does not start with the NULL ('\\0') character and is configured\n"
     "on the local host.  Please provide a valid user name.\n"},
    {122,
     "3417-135 Failure: The C/ACL file name provided (%1$s)\n"
     "is not valid. The ACL library is either unable to find such a file or the\n"
     "nfile is not a regular file.  Please provide an ACL file name that exists\n"
     "on the filesystem and it is not of type block, special character or fifo.\n"
     "(stat(): errno = %2$d)\n"},
    {124,
     "3417-137 Failure: Unable to open the ACL file: %1$s.\n"
     "The following error was returned by the open() subroutine: %2$d.\n"
     "Please make sure that the ACL file name provided is valid and that the ACL\n"
     "file exists on the file system and is readable by the user identity of the\n"
     "process in which the caller of the routine is running.\n"},
    {126,
     "3417-139 Failure: An error occurred while reading the\n"
     "ACL file.  The ACL library was able to read only %1$d bytes out of a total\n"
     "of %2$d bytes that represents the size of the file.  The read routine returned\n"
     "the following errno: %3$d.  Please check the ACL file for validity.\n"},
    {127,
     "3417-140 Failure: The user provided to the routine (%1$s)\n"
     "cannot be found on this system.  Please provide a valid user.\n"},
    {128,
     "3417-141 Failure: The ACL file provided or its correspondent CACL file\n"
     "are not owned by the username provided by the caller, or their file permissions\n"
     "allow others than to owner to write to it, or the CACL file had different\n"
     "file permissions than the corresponding ACL file.\n"
     "ACL/CACL file name: %1$s\n"
     "User name: %2$s\n"
     "Please ensure the following statements are true:\n"
     "(1) the ACL and CACL files are owned by the user whose name is provided\n"
     "    to the routine;\n"
     "(2) only the owner can write to it; and\n"
     "(3) the CACL file has the same file permissions as the corresponding ACL\n"
     "    file.\n"},
    {129,
     "3417-142 Failure: The ACL library is unable to initialize\n"
     "the data structures necessary to convert between the codeset used by this\n"
     "application and the UTF-8 data encoding format.  This failure has occurred\n"
     "because resources needed by the cluster utilities are not available at this\n"
     "time.  Try to run this application again at a later time.\n"},
    {130,
     "3417-143 Failure: The ACL library is unable to translate\n"
     "a character string between the application codeset and the UTF-8 data the\n"
     "UTF-8 data encoding format.  The character string contains bytes that are\n"
     "not valid in the application codeset.  This failure can occur when codesets\n"
     "that do not fully support UTF-8 conversion are used by the execution environment.\n"
     "This failure can also occur if the character string memory is overwritten.\n"
     "Verify that the application uses a locale with a codeset that does support\n"
     "UTF-8 conversion, or contact the system administrator to have the default\n"
     "execution environment set to use such a locale.  Also verify that the application\n"
     "is not accidentally overwriting the character string data.\n"},
    {131,
     "3417-144 Failure: An error occurred while parsing the\n"
     "ACL file.  It appears that the ACLE at line %1$d in the ACL file is corrupted\n"
     "or contains characters that are not understood by the ACL library.  Please\n"
     "check the contents of the ACL file and make sure it conforms with the syntax\n"
     "and semantics defined in the Orvex Guide.\n"},
    {132,
     "3417-145 Failure: An error occurred while parsing the\n"
     "ACL file.  The mechanism mnemonic (%1$s) at line (%2$d) is not valid:\n"
     "it is longer than the maximum 16 characters allowed.  Please edit the ACL\n"
     "file and provide a valid mechanism mnemonic. \n"},
    {133,
     "3417-146 Failure: One of the characters in the ACLE's\n"
     "permission ('%1$c') does not correspond to a valid permission template.\n"
     "Please verify that the character representation of the permissions used\n"
     "corresponds to the permission template set used.\n"},
    {134,
     "3417-147 Failure: The access control list (ACL) does\n"
     "not contain an entry (ACLE) that corresponds to the type (%1$d), and, possibly,\n"
     "the mechanism (%2$s) and the identifier (%3$s) provided.  Make sure the\n"
     "ACL contains such an entry.\n"},
    {135,
     "3417-148 Failure: The access control list (ACL) file name\n"
     "(%1$s) is longer or the same length as the the maximum allowed for a file\n"
     "name.  This condition makes is impossible for the cached ACL (CACL) file\n"
     "to exist.  The CACL file has the same name as the ACL file with the added\n"
     "extension of '.cacl'.  In order to save the compiled ACL in a CACL file,\n"
     "please provide an ACL file name that has a length smaller than the maximum\n"
     "allowed on the system minus 6.\n"},
    {136,
     "3417-149 Failure: The access control list (ACL) file\n"
     "(%1$s) and its corresponding cached ACL (CACL) file do not have the same\n"
     "ownership (user or group).  Please change the ownership of the CACL file\n"
     "to be the same as the ownership of the ACL file.\n"},
    {137,
     "3417-150 Failure: The access control list (ACL) file\n"
     "(%1$s) and its corresponding cached ACL (CACL) file do not have the same\n"
     "file permission .  Please change the permission of the CACL file to be the\n"
     "same as the permission of the ACL file.\n"},
    {138,
     "3417-151 Failure: Unable to open file (%1$s) for writing.\n"
     "Please verify that there is sufficient space on the file system.\n"},
    {139,
     "3417-152 Failure: An error occurred while writing the\n"
     "compiled ACL to the caching file.  The ACL library was able to write only\n"
     "%1$d bytes out of a total of %2$d bytes that represents the size of the compiled\n"
     "ACL.  The write routine returned the following errno: %3$d.  Please check\n"
     "whether there is sufficient space on the file system.\n"},
    {141,
     "3417-154 Failure: An error occurred while trying to set\n"
     "the ownership of the cached ACL (CACL) file (%1$s) to user id %2$s and group\n"
     "id %3$d.  Make sure that the process calling this routine is running as root.\n"},
    {142,
     "3417-155 Failure: An error occurred while trying to set\n"
     "the file permission of the cached ACL (CACL) file (%1$s) to 0x%2$x.  Make\n"
     "sure that the process calling this routine has sufficient authority to change\n"
     "the file permission on the CACL file.\n"},
    {144,
     "3417-157 Failure: Duplicate entries in the ACL.  The ACL already\n"
     "contains an entry with identical type and/or mechanism mnemonic and/or identity.\n"
     "ACLE type: %1$c; mechanism: %2$s; identity: %3$s.\n"
     "Please make sure that all ACL entries in the ACL file or in the ACL buffer\n"
     "are unique.\n"},
    {145,
     "3417-158 Failure: The ACL entry at line %1$d in the ACL\n"
     "file is longer than the maximum allowed of 1096 characters, including\n"
     "the end of line character.  Make sure that the ACL file does not contain\n"
     "any line longer than 1024 characters.\n"},
    {146,
     "3417-160 Failure: The following option was specified more\n"
     "than once: %1$s\n"
     "Please verify that the command was issued correctly.\n"},
    {147,
     "3417-161 Failure: The command detected an incorrect option\n"
     "or a missing option argument.\n"
     "Please verify that the command was issued correctly.\n"},
    {148,
     "3417-162 Failure: The command requires the '-f' option\n"
     "specifying the name of the ACL file that needs to be verified syntactically.\n"
     "Please verify that the command was issued correctly.\n"},
    {149,
     "3417-163 Warning: The command option '-S' has not been\n"
     "implemented yet.  This option instructs the command to stream the input\n"
     "ACL file and it is suitable for large ACL files.\n"},
    {150,
     "3417-164 Warning: The '-s' option is ignored because the\n"
     "command was invoked with the '-u' option.\n"},
    {151,
     "3417-165 Failure: The ACL file name provided (%1$s)\n"
     "is not valid in combination with providing a user name (%2$s).\n"
     "When a username is provided to the command, the file name must not contain\n"
     "any path, absolute or relative, and the file must reside in the user's home\n"
     "directory.\n"
     "Provide an ACL file that resides in the specified user's home directory.\n"},
    {152,
     "3417-166 Failure: Unable to determine the current working\n"
     "directory! (routine: %1$s; errno: %2$d)\n"
     "Please report this condition to the system administrator.\n"},
    {153,
     "3417-167 Failure: The path to the current working directory\n"
     "is too long for the name of the ACL file.\n"
     "Current working directory: %1$s\n"
     "ACL file name: %2$s\n"
     "Please provide a valid ACL file name and, if the problem persist, report\n"
     "this condition to the system administrator.\n"},
    {154,
     "3417-168 Failure: The ACL file name constructed from the\n"
     "options provided (%1$s) is incorrect.\n"
     "The command is either unable to find such a file or the file is not a regular\n"
     "file.  Please provide an ACL file name that exists on the filesystem and\n"
     "it is not of type block, special character or fifo.\n"
     "(stat(): errno = %2$d)\n"},
    {155,
     "3417-169 Failure: The ACL file provided (%1$s) is not\n"
     "owned by the username (%2$s) provided by the invoker, or the ACL file permissions\n"
     "allow others than to owner to write to it.\n"
     "Please ensure the following are true: (1) the ACL file is owned by the user\n"
     "whose name is provided to the routine; and (2) that only the owner can write\n"
     "to it.\n"},
    {156,
     "3417-170 Failure: Unable to open the ACL file: %1$s.\n"
     "The following error was returned by the open() subroutine: %2$d.\n"
     "Please make sure that the ACL file name provided is valid and it exists\n"
     "on the file system, and that the invoker of the command has permission to\n"
     "read the ACL file.\n"},
    {157,
     "3417-171 qzaclfck: The ACL file (%1$s) is empty!\n"
     "Please invoke the command with an ACL file that is not empty.\n"},
    {158,
     "3417-172 Failure: An error occurred while parsing the\n"
     "ACL file.  It appears that the ACLE at line %1$d in the ACL file is missing\n"
     "one or more tokens.  Please check the contents of the ACL file and make\n"
     "sure it conforms with the syntax and semantics defined in the Orvex Guide.\n"},
    {159,
     "3417-173 Failure: An error occurred while parsing the\n"
     "ACL file.  It appears that the ACLE at line %1$d in the ACL file has more\n"
     "tokens than expected.  Please check the contents of the ACL file and make\n"
     "sure it conforms with the syntax and semantics defined in the Orvex Guide.\n"},
    {160,
     "3417-174 Failure: Duplicate 'anyother' or 'unauthenticated' entries in\n"
     "the ACL.  The ACL already contains an entry with identical type.\n"
     "ACLE type: %1$c.\n"
     "Please make sure that all ACL entries in the ACL file or in the ACL buffer\n"
     "are unique.\n"},
    {161,
     "3417-175 Failure: Duplicate 'group' entries in ACL.  The ACL already\n"
     "contains a group with an identical identifier.\n"
     "ACLE type: %1$c; ACLE identifier: %2$s.\n"
     "Please make sure that all ACL entries in the ACL file or in the ACL buffer\n"
     "are unique.\n"},
    {162,
     "3417-176 Warning: Unable to cache the contents of the compiled ACL\n"
     "file because of previously encountered errors.\n"
     "Please correct all errors in the ACL file before the caching can succedd.\n"},
    {163,
     "3417-177 Failure: Unable to rename the temporary ACL cache file to its\n"
     "permanent name.\n"
     "Temporary CACL file: %1$s\n"
     "Permanent CACL file: %2$s\n"
     "Check whether the full directory path exists and it is writable by the user\n"
     "id of the application's process.\n"},
    {164,
     "3417-178 Failure: One of the bits in the ACLE's bit-mask permission\n"
     "(0x%1$08x) does not correspond to a valid permission template.\n"
     "Please verify that the bit-mask representation of the permissions used\n"
     "corresponds to the permission template set used.\n"},
    {165,
     "3417-179 Failure: An error occurred while parsing the ACL file.\n"
     "It appears that the ACLE at line %1$d in the ACL file does not have a valid\n"
     "ACLE type (%2$s).  A valid ACLE type is one of the following characters:\n"
     "\t'n'/'N' for unauthenticated ACLE;\n"
     "\t'o'/'O' for any-other ACLE;\n"
     "\t'u'/'U' for user ACLEs;\n"
     "\t'e'/'E' for expanded ACLEs; and\n"
     "\t'g'/'G' for group ACLEs.\n"
     "Please check the contents of the ACL file and make sure it conforms with\n"
     "the syntax and semantics defined in the Orvex Guide.\n"},
    {166,
     "3417-180 Failure: An error occurred while parsing the ACL file.\n"
     "It appears that the ACLE at line %1$d in the ACL file does not have a valid\n"
     "permission set (%2$s).\n"
     "Please verify that the character representation of the permissions used\n"
     "corresponds to the permission template set used.\n"},
};
// clang-format on

inline constexpr std::size_t text_count = sizeof texts / sizeof texts[0];

// The default text of an id, empty for an id that the library does not use.
constexpr std::string_view default_text(int id) {
    for (const text_entry &entry : texts) {
        if (entry.id == id)
            return entry.text;
    }
    return {};
}

constexpr bool texts_are_in_order() {
    int previous = 0;
    for (const text_entry &entry : texts) {
        if (entry.id <= previous || entry.id >= table_size || !std::string_view(entry.text).ends_with('\n'))
            return false;
        previous = entry.id;
    }
    return true;
}
static_assert(texts_are_in_order(), "ids ascend, stay inside the table, and every text ends its last line");
static_assert(text_count == 79);

} // namespace qz::msg

// The table of default texts for the error facility; null for ids without a text.
extern const std::array<const char *, qz::msg::table_size> cu_mesgtbl_qzseclib_msg;

// Shown for a message id outside the table or without a text. The library's own ids are checked at compile time, so
// only other users of the table see this.
extern const char cu_badid_qzseclib_msg[];

namespace qz::msg {

// The default text of any id.
inline const char *shown_text(int id) {
    const char *text =
        id >= 0 && id < table_size ? cu_mesgtbl_qzseclib_msg[static_cast<std::size_t>(id)] : nullptr;
    return text == nullptr ? cu_badid_qzseclib_msg : text;
}

} // namespace qz::msg

#endif
