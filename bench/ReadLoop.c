/* Takes all that comes over a TCP connection of this machine into one buffer: ReadLoop PORT BYTES. */
#include <arpa/inet.h>
#include <netinet/in.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <unistd.h>

int main(int argc, char** argv)
{
    struct sockaddr_in address = {.sin_family = AF_INET};
    const size_t size = argc > 2 ? strtoul(argv[2], NULL, 10) : 0;
    char* const buffer = malloc(size);
    const int connection = socket(AF_INET, SOCK_STREAM, 0);
    ssize_t length = -1;
    address.sin_port = htons((uint16_t)(argc > 1 ? atoi(argv[1]) : 0));
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    if (buffer != NULL && connect(connection, (struct sockaddr*)&address, sizeof(address)) == 0) {
        while ((length = read(connection, buffer, size)) > 0) {
        }
    }
    free(buffer);
    return length == 0 ? EXIT_SUCCESS : EXIT_FAILURE;
}
