uniform mat4 uView;
uniform mat4 uProjection;

void main( )
{
    gl_Position = uProjection * uView * gl_Vertex;
}
