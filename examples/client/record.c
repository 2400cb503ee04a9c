/* Records one metric of each kind (TALLYCLIENT_SOCKET, or the device's own socket). */
#include <stdio.h>
#include <string.h>
#include <tallyclient/tallyclient.h>

int main(void) {
  tallyclient* metrics = tallyclient_open(NULL);
  const double waits[] = {12.5, 0.75, 3};
  tallyclient_set(metrics, "com.example.pump.temperature", -4);
  tallyclient_add(metrics, "com.example.pump.starts", 1);
  tallyclient_push(metrics, "com.example.pump.pressure", 1.8);
  tallyclient_push_many(metrics, "com.example.pump.wait", waits, 3);
  const int fault = tallyclient_close(metrics);
  if (fault != 0) fprintf(stderr, "not recorded: %s\n", strerror(fault));
  return fault != 0;
}
